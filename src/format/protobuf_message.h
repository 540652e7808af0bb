// Decoding messages of protocol buffers that come from outside. The decoder takes what it is given:
// it calls itself for each level of nesting, and allocates for each field, even an unknown one. So
// a message is measured first.
#pragma once

#include <protobuf-c/protobuf-c.h>

#include <cstdint>
#include <memory>
#include <span>

namespace kivd {

// What a message may have, all levels together. The largest that is of use is a configuration's
// three filters: 20,000 items each, of three fields with the item itself.
inline constexpr int max_message_depth = 64;
inline constexpr uint32_t max_message_fields = 200000;

struct message_releaser {
    void operator()(auto* message) const noexcept {
        protobuf_c_message_free_unpacked(&message->base, nullptr);
    }
};
template <class message>
using unique_message = std::unique_ptr<message, message_releaser>;

enum class message_size : uint8_t {
    fits,
    too_large,  // more fields, or deeper
    broken,     // not whole fields
};
[[nodiscard]] message_size measure_message(const ProtobufCMessageDescriptor& type,
                                           std::span<const uint8_t> bytes);

// The message of that type, whose C struct is `message`; null when it does not fit, cannot be
// decoded, lacks a required field, or there is no memory for it.
template <class message>
[[nodiscard]] unique_message<message> unpack_message(const ProtobufCMessageDescriptor& type,
                                                     std::span<const uint8_t> bytes) {
    if (measure_message(type, bytes) != message_size::fits) return nullptr;
    return unique_message<message>(reinterpret_cast<message*>(
        protobuf_c_message_unpack(&type, nullptr, bytes.size(), bytes.data())));
}

}  // namespace kivd
