// Messages of protobuf-c that free themselves.
#pragma once

#include <cstdint>
#include <memory>
#include <span>
#include <type_traits>

namespace kivd {

template <auto free_unpacked>
struct message_releaser {
    void operator()(auto* message) const noexcept { free_unpacked(message, nullptr); }
};

// The message of the two generated functions in `bytes`; null when it cannot be decoded, lacks a
// required field, or there is no memory for it.
template <auto unpack, auto free_unpacked>
[[nodiscard]] auto unpack_message(std::span<const uint8_t> bytes) {
    using message = std::remove_pointer_t<decltype(unpack(nullptr, 0, nullptr))>;
    return std::unique_ptr<message, message_releaser<free_unpacked>>(
        unpack(nullptr, bytes.size(), bytes.data()));
}

}  // namespace kivd
