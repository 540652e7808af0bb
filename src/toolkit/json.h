// JSON as both tools write it: compact, members in the order in which they were put in.
#pragma once

#include <nlohmann/json.hpp>
#include <optional>
#include <string_view>

namespace kivd {

using json = nlohmann::ordered_json;

// A text. Bytes that are not UTF-8 become \xHH and a backslash becomes two: a JSON string can't
// hold such bytes, and different texts must stay different.
[[nodiscard]] json json_text(std::string_view text);

// What is unknown is null.
template <class type>
[[nodiscard]] json json_or_null(const std::optional<type>& value) {
    return value ? json(*value) : json();
}
[[nodiscard]] json json_or_null(const std::optional<std::string>& text);

}  // namespace kivd
