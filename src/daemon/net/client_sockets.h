// The three sockets in the working directory on which clients reach the daemon.
#pragma once

namespace kivd {

// Makes kiv_cl, kiv_co and kiv_co_stream, replacing what a daemon that was killed left there, and
// adds them to the event loop. A failure is logged and ends the process with exit status 1.
void create_client_sockets();

// Takes no more datagrams, and handles those that have been sent: a producer whose call has
// returned may count on it.
void finish_datagrams();

// Removes their files, closes them and frees all connections.
void remove_client_sockets();

}  // namespace kivd
