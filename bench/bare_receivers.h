// What a socket costs without a daemon behind it: the yardsticks of the event, counter and latency
// measurements. Each runs in a process of its own until it is stopped, or for half a minute without
// a packet.
#pragma once

#include <cstddef>
#include <string>

#include "bench/process.h"
#include "record/gzip_file.h"

namespace kivd::bench {

enum class receiver {
    one_a_wait,       // epoll_wait, recvmsg, two writes and a seek for every packet
    batched,          // recvmmsg of up to 16 packets, one writev for every packet
    batched_discard,  // the same, nothing written
    gathered,         // recvmmsg of up to 16 packets, one writev for all; makes reports
};

// Packets that arrive at `directory`/kiv_cl are appended to `directory`/events: `head_size` bytes
// that stand for a record head, then the packet from `payload_at` on. When the gathering one has as
// much as makes a report, it renames the file and has a child copy it to `directory`/output/kiv_N,
// as the daemon does, compressed or not. The socket exists when this returns, with the options that
// the daemon gives its own.
[[nodiscard]] child_process start_receiver(receiver kind, const std::string& directory,
                                           size_t head_size, size_t payload_at,
                                           gzip_level level = gzip_level::stored);

// Answers every packet of every connection to `directory`/kiv_co with "1".
[[nodiscard]] child_process start_echo_server(const std::string& directory);

}  // namespace kivd::bench
