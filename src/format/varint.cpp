#include "format/varint.h"

#include <algorithm>

namespace kivd {

size_t pack_varint64(uint8_t* out, uint64_t value) {
    size_t size = 0;
    for (; value >= 0x80; value >>= 7U) out[size++] = static_cast<uint8_t>(value | 0x80U);
    out[size++] = static_cast<uint8_t>(value);
    return size;
}

std::optional<uint64_t> take_varint(std::span<const uint8_t>& rest, size_t max_size) {
    const size_t limit = std::min(rest.size(), max_size);
    uint64_t value = 0;
    for (size_t i = 0; i < limit; ++i) {
        value |= uint64_t{rest[i] & 0x7FU} << (7 * i);
        if ((rest[i] & 0x80U) != 0) continue;
        rest = rest.subspan(i + 1);
        return value;
    }
    return std::nullopt;
}

}  // namespace kivd
