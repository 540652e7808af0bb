// Requests by datagram: one way, without a reply. They are taken in batches, since a wake-up for
// each packet costs two context switches.
#pragma once

#include "daemon/loop/event_loop.h"

namespace kivd {

// Takes up to 16 packets that wait on the socket and handles each to its end, in order; events
// are stored when this returns. It takes one with a receive delay, or while there is a debug
// client. False when there was none.
bool receive_datagrams(int fd);

// The same as a callback.
void receive_dgram_client(event_handler& handler);

}  // namespace kivd
