// What there is to know about each request without carrying it out. The rows stand in requests.def;
// what the requests do: docs/requests.md.
#pragma once

#include <cstdint>
#include <string_view>

namespace kivd {

enum class request_access : uint8_t { everyone, permitted };

// `while_collecting`: dropped in silence while data collection is off.
enum class request_collection : uint8_t { always, while_collecting };

// What the words behind the name say first: a probe's package and name, or nothing of that kind.
enum class request_target : uint8_t { probe, none };

// What comes behind that: more words, text up to a NUL, or bytes to the packet's end. Text and
// bytes start one delimiter behind the last word.
enum class request_rest : uint8_t { words, text, bytes };

struct request_row {
    std::string_view name;
    request_access access;
    request_collection collection;
    request_target target;
    request_rest rest;
    const char* refusal;             // logged when permission is lacking
    std::string_view refusal_reply;  // what a refused caller gets; empty: no reply
};

// clang-format off
inline constexpr request_row request_table[] = {
#define KIV_REQUEST(name, handler, access, collection, target, rest, title, refusal_reply)        \
    {#name, request_access::access, request_collection::collection, request_target::target,       \
     request_rest::rest, title " (" #name ") request denied due to permission!", refusal_reply},
#include "format/requests.def"
#undef KIV_REQUEST
};
// clang-format on

// The row of that name; null when there is none.
[[nodiscard]] constexpr const request_row* find_request(std::string_view name) {
    for (const request_row& row : request_table) {
        if (name == row.name) return &row;
    }
    return nullptr;
}

}  // namespace kivd
