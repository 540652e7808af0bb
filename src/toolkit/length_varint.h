// The lengths that stand before fields in files.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>

namespace kivd {

inline constexpr size_t longest_length_varint = 5;  // bytes

struct length_varint {
    size_t size;  // 0: not whole, or longer than any
    uint64_t value;
};

// The length that `data` starts with.
[[nodiscard]] length_varint read_length(std::string_view data);

}  // namespace kivd
