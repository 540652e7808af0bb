#include "util/utf8.h"

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

}  // namespace

size_t utf8_length(std::string_view text) {
    if (text.empty()) return 0;
    for (const utf8_lead& lead : leads) {
        if (byte_at(text, 0) < lead.first || byte_at(text, 0) > lead.last) continue;
        return is_tail(text, lead) ? lead.length : 0;
    }
    return 0;
}

bool is_control(std::string_view character) {
    if (character.size() == 1) return byte_at(character, 0) < 0x20 || character[0] == 0x7f;
    const auto is_between = [character](std::string_view first, std::string_view last) {
        return character >= first && character <= last;
    };
    return is_between("\xc2\x80", "\xc2\x9f") ||          // C1
           is_between("\xe2\x80\xa8", "\xe2\x80\xae") ||  // U+2028 to U+202E
           is_between("\xe2\x81\xa6", "\xe2\x81\xa9");    // U+2066 to U+2069
}

}  // namespace kivd
