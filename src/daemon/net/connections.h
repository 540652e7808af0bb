// Requests with replies, over connections of sequenced packets or of a stream.
#pragma once

#include "daemon/loop/event_loop.h"

namespace kivd {

// Callbacks of the two listening sockets: accept one client and add it to the event loop. The last
// 16 descriptors (a quarter if fewer than 64 are allowed) are kept for reports and saves: a client
// that would get one is disconnected, which is logged and raised.
void accept_seq_client(event_handler& handler);
void accept_stream_client(event_handler& handler);

// Sets the socket's own timeouts for sends and receives to one second. All calls here are
// non-blocking and have deadlines of their own, so these only guard against one that is not. A
// failure is logged and raised.
void set_socket_timeouts(int fd);

// Closes and frees all connections.
void connections_release();

}  // namespace kivd
