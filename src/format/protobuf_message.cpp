#include "format/protobuf_message.h"

#include <optional>

#include "format/varint.h"

namespace kivd {
namespace {

using bytes = std::span<const uint8_t>;

struct field {
    uint32_t number;
    bytes message;  // what a length stands before; else empty
};

std::optional<bytes> take_bytes(bytes& rest, uint64_t size) {
    if (size > rest.size()) return std::nullopt;
    const bytes taken = rest.first(static_cast<size_t>(size));
    rest = rest.subspan(taken.size());
    return taken;
}

// Nothing when what is left does not begin with a whole field.
std::optional<field> take_field(bytes& rest) {
    const auto key = take_varint(rest, max_varint32_size);
    if (!key) return std::nullopt;
    field taken = {static_cast<uint32_t>(*key >> 3U), {}};
    bool is_whole = false;
    switch (*key & 7U) {
        case PROTOBUF_C_WIRE_TYPE_VARINT:
            is_whole = take_varint(rest, max_varint64_size).has_value();
            break;
        case PROTOBUF_C_WIRE_TYPE_64BIT:
            is_whole = take_bytes(rest, 8).has_value();
            break;
        case PROTOBUF_C_WIRE_TYPE_32BIT:
            is_whole = take_bytes(rest, 4).has_value();
            break;
        case PROTOBUF_C_WIRE_TYPE_LENGTH_PREFIXED:
            if (const auto size = take_varint(rest, max_varint32_size)) {
                const auto content = take_bytes(rest, static_cast<uint32_t>(*size));
                is_whole = content.has_value();
                taken.message = content.value_or(bytes());
            }
            break;
        default:
            break;
    }
    return is_whole ? std::optional(taken) : std::nullopt;
}

// The type of the messages that a field of that number holds; null when it holds something else.
const ProtobufCMessageDescriptor* type_within(const ProtobufCMessageDescriptor& type,
                                              uint32_t number) {
    const ProtobufCFieldDescriptor* const known =
        protobuf_c_message_descriptor_get_field(&type, number);
    if (known == nullptr || known->type != PROTOBUF_C_TYPE_MESSAGE) return nullptr;
    return static_cast<const ProtobufCMessageDescriptor*>(known->descriptor);
}

// Takes the fields off `fields_left`.
message_size measure(const ProtobufCMessageDescriptor& type, bytes message, int depth,
                     uint32_t& fields_left) {
    if (depth > max_message_depth) return message_size::too_large;
    while (!message.empty()) {
        const std::optional<field> next = take_field(message);
        if (!next) return message_size::broken;
        if (fields_left-- == 0) return message_size::too_large;
        const ProtobufCMessageDescriptor* const within = type_within(type, next->number);
        if (within == nullptr) continue;
        const message_size size = measure(*within, next->message, depth + 1, fields_left);
        if (size != message_size::fits) return size;
    }
    return message_size::fits;
}

}  // namespace

message_size measure_message(const ProtobufCMessageDescriptor& type,
                             std::span<const uint8_t> bytes) {
    uint32_t fields_left = max_message_fields;
    return measure(type, bytes, 0, fields_left);
}

}  // namespace kivd
