// The client's side of the sockets: packets sent as fast as they are taken, and requests with an
// answer. A call that waits for some seconds gives the run up.
#pragma once

#include <string>
#include <string_view>

#include "util/unique_fd.h"

namespace kivd::bench {

// A blocking datagram socket connected to `directory`/kiv_cl.
[[nodiscard]] unique_fd connect_producer(const std::string& directory);
void send_packet(int fd, std::string_view packet);
// Waits until the receiver has taken all that was sent through `fd`.
void wait_until_taken(int fd);

// A connection to `directory`/kiv_co; waits until somebody listens there.
[[nodiscard]] unique_fd connect_control(const std::string& directory);
// Sends a request that has no answer, or one that has.
void order(int fd, std::string_view request);
std::string ask(int fd, std::string_view request);

// Request packets. The counters are called com.example.app and counter_00000 onwards.
[[nodiscard]] std::string event_packet(size_t payload_size);
[[nodiscard]] std::string increment_packet(unsigned number);
// Where the payload begins in an event packet, and how long the head of the record is into which
// the daemon makes it.
[[nodiscard]] size_t event_payload_offset();
[[nodiscard]] size_t event_head_size(size_t payload_size);

}  // namespace kivd::bench
