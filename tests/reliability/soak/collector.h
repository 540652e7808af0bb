// Takes the reports away as they appear, as whoever collects them does, and checks that of each
// client all events are there, once and in their order.
#pragma once

#include <poll.h>
#include <sys/inotify.h>

#include <cstdio>
#include <thread>

#include "end_to_end/daemon_test.h"
#include "traffic.h"

namespace kivd::soak {

class collector {
 public:
    collector() {
        EXPECT_GE(inotify_add_watch(inotify_.get(), "output", IN_MOVED_TO), 0) << strerror(errno);
        for (int i = 0; i < client_count; ++i) next_[static_cast<size_t>(i)] = next_event(i, 0);
        thread_ = std::jthread([this](const std::stop_token& stop) {
            pollfd names = {inotify_.get(), POLLIN, 0};
            while (!stop.stop_requested()) {
                if (poll(&names, 1, look_for_stop_ms) > 0) take_reports();
            }
        });
    }

    // When the daemon has ended: checks what it has left, and that nothing is missing.
    void finish(const message_counts& counts) {
        thread_ = std::jthread();
        take_reports();
        EXPECT_EQ(report_paths().size(), 0U);
        check(parse(read_file("private/events")));
        for (size_t i = 0; i < client_count; ++i) {
            EXPECT_EQ(next_[i], next_event(static_cast<int>(i), counts[i])) << "of client " << i;
        }
        const probe_values expected = values_after(counts);
        EXPECT_EQ(values_.counters, expected.counters);
        EXPECT_EQ(values_.texts, expected.texts);
        printf("%lu events in %lu reports\n", events_, reports_);
    }

 private:
    static constexpr int look_for_stop_ms = 50;

    // Their names come in the order in which they were made, which their numbers don't tell once
    // some have been taken away.
    void take_reports() {
        alignas(inotify_event) std::array<char, 65536> names;
        const ssize_t size = read(inotify_.get(), names.data(), names.size());
        for (ssize_t at = 0; at < size;) {
            const auto* const found = reinterpret_cast<const inotify_event*>(names.data() + at);
            at += static_cast<ssize_t>(sizeof(inotify_event) + found->len);
            EXPECT_EQ(found->mask, uint32_t{IN_MOVED_TO});
            if (!std::string_view(found->name).starts_with("kiv_")) continue;
            const std::string path = std::string("output/") + found->name;
            check(parse(gunzip_file(path)));
            EXPECT_TRUE(std::filesystem::remove(path)) << path;
            ++reports_;
        }
    }

    void check(const kiv::Report& report) {
        EXPECT_NE(report.header().device_id(), "");
        for (const kiv::Event& event : report.events()) {
            if (event.package() == "soak" && !testing::Test::HasFailure()) check(event);
        }
        for (const auto& each : report.counters()) {
            if (each.package() == "soak") values_.counters[each.name()] = each.value();
        }
        for (const auto& each : report.statics()) {
            if (each.package() == "soak") values_.texts[each.name()] = each.value();
        }
    }

    void check(const kiv::Event& event) {
        size_t client = client_count;
        uint64_t number = 0;
        (void)sscanf(event.name().c_str(), "%zu.%lu", &client, &number);
        ASSERT_LT(client, size_t{client_count}) << event.name();
        const int of = static_cast<int>(client);
        EXPECT_EQ(number, next_[client]) << "of client " << client;
        EXPECT_TRUE(event.payload() == payload_of(of, number)) << event.name();
        next_[client] = next_event(of, number + 1);
        ++events_;
    }

    const unique_fd inotify_{inotify_init1(IN_CLOEXEC | IN_NONBLOCK)};
    message_counts next_ = {};  // the event of each client that comes next
    probe_values values_;       // as last reported
    uint64_t reports_ = 0;
    uint64_t events_ = 0;
    std::jthread thread_;  // last: it uses the others
};

}  // namespace kivd::soak
