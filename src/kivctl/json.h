// JSON text, put together from its pieces.
#pragma once

#include <concepts>
#include <initializer_list>
#include <optional>
#include <span>
#include <string>
#include <string_view>

namespace kivd {

// A text in quotes. Bytes that are no UTF-8 become \xHH and a backslash two, so that different
// texts stay different, before what JSON wants escaped is.
[[nodiscard]] std::string json(std::string_view text);
[[nodiscard]] inline std::string json(const char* text) { return json(std::string_view(text)); }
[[nodiscard]] inline std::string json(const std::string& text) {
    return json(std::string_view(text));
}
template <std::integral number>
[[nodiscard]] std::string json(number value) {
    if constexpr (std::same_as<number, bool>) return value ? "true" : "false";
    return std::to_string(value);
}

// Unknown is null.
template <class type>
[[nodiscard]] std::string json(const std::optional<type>& value) {
    return value ? json(*value) : "null";
}

// `value` is JSON already.
struct json_member {
    std::string_view name;
    std::string value;
};
[[nodiscard]] std::string json_object(std::initializer_list<json_member> members);
[[nodiscard]] std::string json_array(std::span<const std::string> values);

}  // namespace kivd
