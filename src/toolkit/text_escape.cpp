#include "toolkit/text_escape.h"

#include <algorithm>
#include <cstdint>

#include "util/utf8.h"

namespace kivd {
namespace {

void append_hex(std::string& to, std::string_view bytes) {
    constexpr char digits[] = "0123456789ABCDEF";
    for (size_t i = 0; i < bytes.size(); ++i) {
        to += "\\x";
        to += digits[static_cast<uint8_t>(bytes[i]) >> 4];
        to += digits[static_cast<uint8_t>(bytes[i]) & 15];
    }
}

// The number of leading characters that never need escaping.
size_t plain_length(std::string_view text) {
    size_t length = 0;
    while (length < text.size() && text[length] >= 0x20 && text[length] < 0x7f &&
           text[length] != '\\') {
        ++length;
    }
    return length;
}

std::string escape(std::string_view text, bool controls_too, size_t max_characters) {
    std::string escaped;
    escaped.reserve(text.size());
    for (size_t characters = 0; !text.empty(); ++characters) {
        const size_t plain = std::min(plain_length(text), max_characters - characters);
        escaped += text.substr(0, plain);
        text.remove_prefix(plain);
        characters += plain;
        if (text.empty()) break;
        if (characters == max_characters) return escaped + "...";
        const size_t length = utf8_length(text);
        const std::string_view character = text.substr(0, length == 0 ? 1 : length);
        text.remove_prefix(character.size());
        if (length == 0 || (controls_too && is_control(character))) {
            append_hex(escaped, character);
        } else if (character == "\\") {
            escaped += "\\\\";
        } else {
            escaped += character;
        }
    }
    return escaped;
}

}  // namespace

bool is_text(std::string_view bytes) {
    while (!bytes.empty()) {
        const size_t length = utf8_length(bytes);
        const bool is_space = bytes[0] == '\t' || bytes[0] == '\r' || bytes[0] == '\n';
        if (length == 0 || (is_control(bytes.substr(0, 1)) && !is_space)) return false;
        bytes.remove_prefix(length);
    }
    return true;
}

std::string escape_non_utf8(std::string_view text) {
    return escape(text, false, std::string_view::npos);
}

std::string printable(std::string_view text, size_t max_characters) {
    return escape(text, true, max_characters);
}

}  // namespace kivd
