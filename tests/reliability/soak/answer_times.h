// How long a client that asks every few milliseconds waits for its answer.
#pragma once

#include <algorithm>
#include <chrono>
#include <thread>

#include "end_to_end/daemon_test.h"

namespace kivd::soak {

using milliseconds = std::chrono::duration<float, std::milli>;

class answer_times {
 public:
    std::vector<milliseconds> finish() {
        thread_ = std::jthread();
        return std::move(times_);
    }

 private:
    void ask_on(const std::stop_token& stop) {
        const unique_fd client = connect_client(socket_kind::packets);
        while (!stop.stop_requested()) {
            const auto start = std::chrono::steady_clock::now();
            EXPECT_EQ(ask(client.get(), "IA"), "1");
            times_.push_back(std::chrono::steady_clock::now() - start);
            std::this_thread::sleep_for(std::chrono::milliseconds(5));
        }
    }

    std::vector<milliseconds> times_;
    std::jthread thread_{[this](const std::stop_token& stop) { ask_on(stop); }};
};

inline std::string summary(std::vector<milliseconds> times) {
    if (times.empty()) return "IA not asked";
    std::ranges::sort(times);
    const auto at = [&times](size_t percent) {
        return static_cast<double>(times[(times.size() - 1) * percent / 100].count());
    };
    std::array<char, 80> text;
    (void)snprintf(text.data(), text.size(), "IA median %.2f ms, p99 %.2f, slowest %.1f", at(50),
                   at(99), at(100));
    return text.data();
}

}  // namespace kivd::soak
