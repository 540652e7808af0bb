// Requests by datagram: one way, without a reply.
#pragma once

#include "daemon/loop/event_loop.h"

namespace kivd {

// Takes up to 16 packets that wait on the socket and handles each to its end, in order.
void receive_dgram_client(event_handler& handler);

}  // namespace kivd
