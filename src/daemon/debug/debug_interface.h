// The debug interface: a TCP listener whose one client gets a copy of every request that the daemon
// handles. It reads nothing and never keeps the daemon waiting. Frames: docs/requests.md.
#pragma once

#include <cstdint>
#include <span>

namespace kivd {

// Listens on port 2305 of every interface. Ends the process when that fails.
void debug_start();

// Stops listening and hangs up.
void debug_release();

[[nodiscard]] bool debug_has_client();

// Sends the packet to the client, if there is one, without waiting. A frame that finds no room is
// lost, with a log line. After one that was sent in part the client is dropped, since it could not
// find the start of the next.
void debug_mirror_request(std::span<const char> packet);

}  // namespace kivd
