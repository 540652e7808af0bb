// Base-128 varints, least significant group first, as protocol buffers have them: of 1 to 5 bytes
// for 32 bits, of 1 to 10 for 64.
#pragma once

#include <bit>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>

namespace kivd {

inline constexpr size_t max_varint32_size = 5;
inline constexpr size_t max_varint64_size = 10;

// Bytes that the varint of `value` takes.
[[nodiscard]] constexpr size_t varint64_size(uint64_t value) {
    return (static_cast<size_t>(std::bit_width(value | 1U)) + 6) / 7;
}
[[nodiscard]] constexpr size_t varint32_size(uint32_t value) { return varint64_size(value); }

// Writes the varint of `value` to `out`, which has room for the longest; gives the bytes written.
size_t pack_varint64(uint8_t* out, uint64_t value);
inline size_t pack_varint32(uint8_t* out, uint32_t value) { return pack_varint64(out, value); }

// Takes a varint of at most `max_size` bytes off the front of `rest`. Nothing, with `rest` as it
// was, when the bytes end before it or it is longer. Bits beyond 64 are lost.
[[nodiscard]] std::optional<uint64_t> take_varint(std::span<const uint8_t>& rest, size_t max_size);

}  // namespace kivd
