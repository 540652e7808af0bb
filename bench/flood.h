// Many clients that send to one daemon as fast as it takes their messages: connections, every other
// one to the stream socket, and behind them producers that use libkiv.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <stop_token>
#include <string>
#include <vector>

#include "bench/daemon_process.h"
#include "client/kiv.h"
#include "util/unique_fd.h"

namespace kivd {

class flood {
 public:
    flood(std::string directory, size_t connections, size_t producers);

    // Again, to a daemon that has been started anew; the counts go on.
    void connect();
    // Sends until `is_enough`, which is asked all the time, and returns when everything has been
    // carried out. False as soon as the daemon hangs up, or gives a wrong answer or none.
    [[nodiscard]] bool send(const std::function<bool()>& is_enough);

    // How many messages each client has sent so far, producers last.
    [[nodiscard]] std::vector<uint64_t> counts() const;
    [[nodiscard]] uint64_t total() const;
    // How many of those of a connection have been carried out for certain; 0 for a producer.
    [[nodiscard]] uint64_t acknowledged(size_t client) const;

 private:
    struct connection {
        unique_fd fd;
        bool is_stream = false;
        bool is_ready = false;
        size_t awaited = 0;  // answers, of one byte each
        uint64_t asked = 0;  // the number of messages up to the last that has an answer
        uint64_t acknowledged = 0;
    };

    [[nodiscard]] bool send_round();
    [[nodiscard]] bool receive_answers(connection& client);
    [[nodiscard]] bool send_batch(size_t number);
    [[nodiscard]] bool wait_done();
    void produce(const std::stop_token& stop);

    std::string directory_;
    std::vector<connection> connections_;
    std::vector<std::unique_ptr<kiv_handle, releaser<kiv_destroy>>> producers_;
    unique_fd barrier_;
    std::vector<std::atomic<uint64_t>> counts_;
    std::atomic<bool> has_failed_ = false;
};

}  // namespace kivd
