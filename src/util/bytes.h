// The same bytes as characters and as numbers.
#pragma once

#include <cstdint>
#include <span>
#include <string_view>

namespace kivd {

[[nodiscard]] inline std::span<const uint8_t> bytes_of(std::string_view text) {
    return {reinterpret_cast<const uint8_t*>(text.data()), text.size()};
}

[[nodiscard]] inline std::string_view text_of(std::span<const uint8_t> bytes) {
    return {reinterpret_cast<const char*>(bytes.data()), bytes.size()};
}

}  // namespace kivd
