// Makes text from reports and requests safe to show: names and values are whatever bytes a producer
// sent.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace kivd {

// Whether `bytes` can be read as lines: UTF-8, and no ASCII control characters but tabs and line
// ends.
[[nodiscard]] bool is_text(std::string_view bytes);

// `text` as UTF-8: invalid bytes become \xHH and a backslash becomes two, so that different texts
// stay different.
[[nodiscard]] std::string escape_non_utf8(std::string_view text);

// The same for a terminal: control characters become \xHH too, and a text of more than
// `max_characters` characters ends in "..." there.
[[nodiscard]] std::string printable(std::string_view text, size_t max_characters = 200);

}  // namespace kivd
