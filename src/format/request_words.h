// The text of a request: a command of two letters and its arguments, words between blanks. What
// follows a word is the one blank behind it, and then the next argument, which may hold anything.
#pragma once

#include <cstddef>

#include "client/kiv.h"
#include "client/transport.h"

namespace kivd {

// Limits of a request, in bytes.
inline constexpr size_t max_packet_size = libkiv::request_size_max;  // on each kind of socket
inline constexpr size_t max_probe_id_size = KIV_PROBE_ID_MAX;        // package and name together
inline constexpr size_t max_payload_size = KIV_PAYLOAD_MAX;          // of an event

// Not strcspn, which would build a table of its set for each word.
[[nodiscard]] constexpr bool is_blank(char c) {
    return c == ' ' || c == '\t' || c == '\r' || c == '\n';
}

struct request_word {
    const char* start;
    const char* end;  // at the blank behind it, or at the end of the text

    [[nodiscard]] bool empty() const { return start == end; }
};

// The first word of a text that a NUL ends.
[[nodiscard]] constexpr request_word find_word(const char* text) {
    while (is_blank(*text)) ++text;
    const char* end = text;
    while (*end != '\0' && !is_blank(*end)) ++end;
    return {text, end};
}

}  // namespace kivd
