#include "kivctl/watch_frames.h"

#include <cstdint>

#include "format/request_words.h"
#include "format/varint.h"
#include "util/bytes.h"

namespace kivd {
namespace {

constexpr size_t head_size = 4;
constexpr char packet_key = 0x0a;                         // field 1, length-delimited
constexpr size_t message_size_min = 2;                    // of an empty packet
constexpr size_t message_size_max = 4 + max_packet_size;  // of the largest one

size_t read_head(std::string_view head) {
    size_t size = 0;
    for (const char byte : head.substr(0, head_size)) size = size << 8 | static_cast<uint8_t>(byte);
    return size;
}

// The packet in a message; nothing when the message holds anything else.
std::optional<std::string_view> find_packet(std::string_view message) {
    if (message[0] != packet_key) return std::nullopt;
    std::span<const uint8_t> packet = bytes_of(message.substr(1));
    const std::optional<uint64_t> length = take_varint(packet, max_varint32_size);
    return length == packet.size() ? std::optional(text_of(packet)) : std::nullopt;
}

}  // namespace

void frame_reader::add(std::string_view bytes) {
    data_.erase(0, start_);
    start_ = 0;
    data_ += bytes;
}

std::optional<debug_frame> frame_reader::next() {
    const std::string_view left = std::string_view(data_).substr(start_);
    if (is_broken_ || left.size() < head_size) return std::nullopt;
    const size_t message_size = read_head(left);
    is_broken_ = message_size < message_size_min || message_size > message_size_max;
    if (is_broken_ || left.size() - head_size < message_size) return std::nullopt;
    const auto packet = find_packet(left.substr(head_size, message_size));
    is_broken_ = !packet;
    if (is_broken_) return std::nullopt;
    start_ += head_size + message_size;
    return debug_frame{left.substr(0, head_size + message_size), *packet};
}

}  // namespace kivd
