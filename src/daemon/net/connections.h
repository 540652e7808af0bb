// Requests with replies, over connections of sequenced packets or of a stream.
#pragma once

#include "daemon/loop/event_loop.h"

namespace kivd {

// Callbacks of the two listening sockets: accept one client and add it to the event loop. The last
// 16 descriptors (a quarter if fewer than 64 are allowed) are kept for reports and saves: a client
// that would get one is hung up on, which is logged and raised.
void accept_seq_client(event_handler& handler);
void accept_stream_client(event_handler& handler);

// One second for sends and receives. A failure is logged and raised; the socket then waits longer.
void set_socket_timeouts(int fd);

// Closes and frees all connections.
void connections_release();

}  // namespace kivd
