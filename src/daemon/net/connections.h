// Requests with replies, over connections of sequenced packets or of a stream. No client makes the
// others wait: see daemon/net/connection.h.
#pragma once

#include <cstdint>

#include "daemon/loop/event_loop.h"

namespace kivd {

// Callbacks of connections: receive what is there and handle the packet that it completes.
void receive_seq_client(event_handler& handler);
void receive_stream_client(event_handler& handler);

// A tick: admits connections that wait for a place, and gives up what has waited too long in any of
// the others. Whether anything still waits.
[[nodiscard]] bool tend_connections(int64_t now_ms);

// Closes and frees all connections.
void connections_release();

}  // namespace kivd
