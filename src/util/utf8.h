// Text of outsiders, which may be any bytes, seen as UTF-8.
#pragma once

#include <cstddef>
#include <string_view>

namespace kivd {

// The length in bytes of the UTF-8 character that `text` starts with; 0 when it is empty or starts
// with something else.
[[nodiscard]] size_t utf8_length(std::string_view text);

// Whether one UTF-8 character acts on a display rather than being shown: control characters (C0,
// DEL, C1), separators of lines (U+2028, U+2029), and what changes the direction of the text around
// it (U+202A to U+202E, U+2066 to U+2069).
[[nodiscard]] bool is_control(std::string_view character);

}  // namespace kivd
