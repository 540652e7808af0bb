#include "util/numbers.h"

#include <algorithm>
#include <charconv>
#include <cstdlib>
#include <limits>

namespace kivd {

int64_t parse_int64(const char* text) {
    const bool negative = *text == '-';
    if (negative) ++text;
    uint64_t value = 0;  // wraps where the signed type must not
    for (; *text != '\0'; ++text) {
        const int digit = static_cast<unsigned char>(*text) - '0';
        value = value * 10 + static_cast<uint64_t>(int64_t{digit});
    }
    return static_cast<int64_t>(negative ? 0 - value : value);
}

int32_t saturate_int32(int64_t value) {
    using limits = std::numeric_limits<int32_t>;
    return static_cast<int32_t>(std::clamp(value, int64_t{limits::min()}, int64_t{limits::max()}));
}

int32_t parse_saturated(const char* text) {
    return saturate_int32(strtoll(text, nullptr, 10));  // strtoll saturates by itself
}

char* format_int64(char* out, int64_t value) { return std::to_chars(out, out + 20, value).ptr; }

}  // namespace kivd
