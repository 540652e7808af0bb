// Accepting clients.
#pragma once

#include "daemon/loop/event_loop.h"

namespace kivd {

// Callbacks of the two listening sockets: accept one client and add it to the event loop. While
// there is no place for anybody (daemon/net/client_places.h), clients stay in the queue. A client
// of a user who has no place left waits without one, so that those behind it need not wait for that
// user. Either is logged and raised, once for each shortage.
void accept_seq_client(event_handler& handler);
void accept_stream_client(event_handler& handler);

}  // namespace kivd
