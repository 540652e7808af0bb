#include "toolkit/text_escape.h"

#include <algorithm>
#include <cstdint>

namespace kivd {
namespace {

struct utf8_lead {
    uint8_t first, last;                // of the lead byte
    uint8_t second_first, second_last;  // of the next byte; any further ones are 80 to BF
    size_t length;
};

// The second byte's range excludes overlong forms, surrogates and everything above U+10FFFF.
// clang-format off
constexpr utf8_lead leads[] = {
    {0x00, 0x7f, 0x00, 0xff, 1},
    {0xc2, 0xdf, 0x80, 0xbf, 2},
    {0xe0, 0xe0, 0xa0, 0xbf, 3},
    {0xe1, 0xec, 0x80, 0xbf, 3},
    {0xed, 0xed, 0x80, 0x9f, 3},
    {0xee, 0xef, 0x80, 0xbf, 3},
    {0xf0, 0xf0, 0x90, 0xbf, 4},
    {0xf1, 0xf3, 0x80, 0xbf, 4},
    {0xf4, 0xf4, 0x80, 0x8f, 4},
};
// clang-format on

uint8_t byte_at(std::string_view text, size_t index) { return static_cast<uint8_t>(text[index]); }

bool is_tail(std::string_view text, const utf8_lead& lead) {
    if (text.size() < lead.length) return false;
    if (lead.length == 1) return true;
    if (byte_at(text, 1) < lead.second_first || byte_at(text, 1) > lead.second_last) return false;
    for (size_t i = 2; i < lead.length; ++i) {
        if (byte_at(text, i) < 0x80 || byte_at(text, i) > 0xbf) return false;
    }
    return true;
}

// The length in bytes of the UTF-8 character that `text` starts with, 0 when it starts with
// something else.
size_t utf8_length(std::string_view text) {
    if (text.empty()) return 0;
    for (const utf8_lead& lead : leads) {
        if (byte_at(text, 0) < lead.first || byte_at(text, 0) > lead.last) continue;
        return is_tail(text, lead) ? lead.length : 0;
    }
    return 0;
}

// `character` is one UTF-8 character: C0, DEL, or C1, which is C2 80 to C2 9F.
bool is_control(std::string_view character) {
    if (character.size() == 1) return byte_at(character, 0) < 0x20 || character[0] == 0x7f;
    return byte_at(character, 0) == 0xc2 && byte_at(character, 1) < 0xa0;
}

void append_hex(std::string& to, std::string_view bytes) {
    constexpr char digits[] = "0123456789ABCDEF";
    for (size_t i = 0; i < bytes.size(); ++i) {
        to += "\\x";
        to += digits[byte_at(bytes, i) >> 4];
        to += digits[byte_at(bytes, i) & 15];
    }
}

// The number of leading characters that never need escaping.
size_t plain_length(std::string_view text) {
    size_t length = 0;
    while (length < text.size() && byte_at(text, length) >= 0x20 && byte_at(text, length) < 0x7f &&
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
