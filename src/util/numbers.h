// Decimal text to numbers, as the stored files and the requests have them.
#pragma once

#include <cstdint>

namespace kivd {

// Reads an optional "-" and then every byte up to the NUL as a digit, with no check that it is one;
// wraps beyond 64 bits. Stored lists are read with this.
[[nodiscard]] int64_t parse_int64(const char* text);

// Reads like atoi (blanks, sign, digits; 0 for text that is no number); what does not fit becomes
// the nearest signed 32-bit value.
[[nodiscard]] int32_t parse_saturated(const char* text);

// `value`, or the nearest that fits signed 32 bits.
[[nodiscard]] int32_t saturate_int32(int64_t value);

// Writes `value` in decimal without a NUL; gives the end. `out` has room for 20 bytes.
[[nodiscard]] char* format_int64(char* out, int64_t value);

}  // namespace kivd
