// One request packet while it is being handled: text split into tokens at blanks (space, tab,
// carriage return, line feed), in place. A NUL ends the text.
#pragma once

#include <sys/socket.h>

#include <cstddef>
#include <span>
#include <string_view>

#include "util/unique_fd.h"

namespace kivd {

struct request_sender {
    int fd;                 // the connection; -1 for a datagram
    uid_t uid;              // of a connection's peer
    const msghdr* message;  // of a datagram: carries its sender's credentials
};

struct request {
    request_sender sender;
    std::span<char> packet;  // followed by a NUL and by room for a reply
    char* token_end;         // the NUL behind the last token taken
    char* rest;              // where the next token is looked for
    const char* command;     // the first token; null when there is none
};

// Takes the command off the packet.
[[nodiscard]] request make_request(const request_sender& sender, std::span<char> packet);

// The next token, or null when there is none left.
[[nodiscard]] const char* next_token(request& r);

// What follows the one delimiter behind the last token, as raw bytes, NULs included.
[[nodiscard]] std::span<const char> raw_rest(const request& r);

// The same as text, up to the first NUL; empty when the last token ended the text.
[[nodiscard]] const char* text_rest(const request& r);

// What a request is answered with.
struct answer {
    size_t size;           // of the text at the start of the packet; 0: none
    unique_fd descriptor;  // ok: goes out in place of the text
};

[[nodiscard]] inline answer no_answer() { return {0, unique_fd()}; }

// Writes the text over the packet.
[[nodiscard]] answer answer_with(request& r, std::string_view text);

// Answers with a descriptor, or with the text "FAIL" when it is none. There is no answer to a
// datagram, whose sender cannot be sent one.
[[nodiscard]] answer answer_with(request& r, unique_fd descriptor);

// A probe's id: package and name.
struct probe_id {
    const char* package;  // null when missing
    const char* name;     // null when missing
};

// Takes the next two tokens as a probe's id. False, which has been logged and raised, when one is
// missing or they are too long together.
[[nodiscard]] bool take_probe_id(request& r, probe_id& probe);

// Whether there is a value that is not empty; if not, that has been logged and raised.
[[nodiscard]] bool check_probe_value(const request& r, const probe_id& probe, const char* value);

}  // namespace kivd
