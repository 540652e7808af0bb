#include "toolkit/length_varint.h"

#include <algorithm>

namespace kivd {

length_varint read_length(std::string_view data) {
    uint64_t value = 0;
    for (size_t i = 0; i < std::min(data.size(), longest_length_varint); ++i) {
        const auto byte = static_cast<uint8_t>(data[i]);
        value |= static_cast<uint64_t>(byte & 0x7f) << (7 * i);
        if (byte < 0x80) return {i + 1, value};
    }
    return {0, 0};
}

}  // namespace kivd
