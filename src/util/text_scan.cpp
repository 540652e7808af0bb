#include "util/text_scan.h"

#include <charconv>
#include <limits>

namespace kivd {
namespace {

bool is_space(char c) { return c == ' ' || (c >= '\t' && c <= '\r'); }

const char* skip_space(const char* text) {
    while (is_space(*text)) ++text;
    return text;
}

}  // namespace

const char* scan_key(const char* line, std::string_view key) {
    for (const char c : key) {
        if (c == ' ') {
            line = skip_space(line);
        } else if (*line++ != c) {
            return nullptr;
        }
    }
    return line;
}

std::string_view scan_word(const char* text, size_t width) {
    text = skip_space(text);
    size_t length = 0;
    while (length < width && text[length] != '\0' && !is_space(text[length])) ++length;
    return {text, length};
}

std::optional<int64_t> scan_number(const char* text, size_t width) {
    std::string_view word = scan_word(text, width > 0 ? width : std::string_view::npos);
    if (word.starts_with("+") && !word.starts_with("+-")) word.remove_prefix(1);
    int64_t value = 0;
    const auto [end, error] = std::from_chars(word.data(), word.data() + word.size(), value);
    if (error == std::errc::result_out_of_range) {
        using limits = std::numeric_limits<int64_t>;
        return word.starts_with("-") ? limits::min() : limits::max();
    }
    if (error != std::errc{}) return std::nullopt;
    return value;
}

}  // namespace kivd
