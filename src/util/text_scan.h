// Reading "key: value" lines. A key or a format matches as scanf would match it, so a blank in a
// key stands for any run of white space, none included.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>

namespace kivd {

// The text behind `key` when `line` starts with it, else null.
[[nodiscard]] const char* scan_key(const char* line, std::string_view key);

// The first word of `text`, cut to `width` characters; empty when there is none.
[[nodiscard]] std::string_view scan_word(const char* text, size_t width);

// The decimal number that `text` starts with, behind white space, of which at most `width`
// characters are read (0: all of them); what does not fit 64 bits becomes the nearest that does.
[[nodiscard]] std::optional<int64_t> scan_number(const char* text, size_t width = 0);

}  // namespace kivd
