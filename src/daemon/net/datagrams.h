// Requests by datagram: one way, without a reply. They are taken in batches, since a wake-up for
// each packet costs two context switches.
#pragma once

#include "daemon/loop/event_loop.h"

namespace kivd {

// Takes up to 16 packets that wait on the socket and handles each to its end, in order. With a
// receive delay it takes one, since the delay is meant for each packet. False when there was none.
bool receive_datagrams(int fd);

// The same as a callback.
void receive_dgram_client(event_handler& handler);

}  // namespace kivd
