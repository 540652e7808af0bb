// The buffers that request packets are received into.
#pragma once

#include <array>
#include <cstddef>

#include "format/request_words.h"

namespace kivd {

inline constexpr size_t receive_size = max_packet_size + 1;  // shows that a packet is larger
inline constexpr size_t max_reply_size = 63;                 // with its NUL, at most 64 bytes
inline constexpr size_t max_batch = 16;

// The packet, a NUL, and room for a reply that may start anywhere in the packet.
struct alignas(64) packet_buffer {
    std::array<char, receive_size + 1 + max_reply_size> bytes;
};

struct packet_buffers {
    std::array<packet_buffer, max_batch> packets;
};

// Maps the buffers. False, with errno set, when that is not possible.
[[nodiscard]] bool packet_buffers_init();

// Valid after packet_buffers_init. The callbacks of all sockets share them in turn.
[[nodiscard]] packet_buffers& get_packet_buffers();

void packet_buffers_release();

}  // namespace kivd
