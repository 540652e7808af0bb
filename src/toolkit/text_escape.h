// Makes text from reports and requests safe to show: names and values are whatever bytes a producer
// sent.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace kivd {

// The length in bytes of the UTF-8 character that `text` starts with, 0 when it starts with
// something else.
[[nodiscard]] size_t utf8_length(std::string_view text);

// `text` as UTF-8: invalid bytes become \xHH and a backslash becomes two, so that different texts
// stay different.
[[nodiscard]] std::string escape_non_utf8(std::string_view text);

// The same for a terminal: control characters become \xHH too, and a text of more than
// `max_characters` characters ends in "..." there.
[[nodiscard]] std::string printable(std::string_view text, size_t max_characters = 200);

}  // namespace kivd
