// The kernel bridge: a thread that receives what the kernel reports over netlink and sends it on,
// as ordinary requests, to the socket on which the daemon listens by default. It touches no store.
//
// Every local user can send to its netlink port, and to the daemon the bridge has the daemon's own
// user id. So it passes on counters and events that it has translated itself, and nothing else. The
// sockets stay open when it ends, so that nobody else takes the port.
#pragma once

#include <sys/un.h>

#include <cstdint>

#include "util/unique_fd.h"

namespace kivd {

// Where the requests go.
struct daemon_socket {
    sockaddr_un address = {};
    unique_fd fd;
};

// The steps of the set-up. A failure has been logged, but for the refusal (ECONNREFUSED) of a
// kernel in which nothing listens.
[[nodiscard]] bool open_daemon_socket(daemon_socket& daemon);
[[nodiscard]] bool open_netlink_socket(unique_fd& netlink);
[[nodiscard]] bool send_pid_to_kernel(int netlink);

// Receives one message and sends on what it says, waiting for either until the daemon is to stop.
// What is wrong with the message has been logged and raised, and so has a lack of memory, after
// which the message is still there.
void receive_kernel_message(int netlink, daemon_socket& daemon);

// The body of the thread: ends when the set-up fails or the daemon is to stop.
void run_kernel_bridge();

// Starts the thread, which takes no signals, and waits until it is set up or has failed. False when
// there is none.
[[nodiscard]] bool start_kernel_bridge();
// Waits until it has ended; a stop has to be requested first.
void join_kernel_bridge();

}  // namespace kivd
