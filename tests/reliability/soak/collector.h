// Takes the reports away as they appear, as whoever collects them does, and checks that of each
// client all events are there, once and in their order.
#pragma once

#include <poll.h>
#include <sys/inotify.h>

#include <cstdio>
#include <cstring>
#include <thread>

#include "bench/traffic.h"
#include "end_to_end/daemon_test.h"

namespace kivd::soak {

class collector {
 public:
    explicit collector(size_t clients) : next_(clients) {
        EXPECT_GE(inotify_add_watch(inotify_.get(), "output", IN_MOVED_TO), 0) << strerror(errno);
        for (size_t i = 0; i < clients; ++i) expect_event_from({i, 0});
        thread_ = std::jthread([this](const std::stop_token& stop) {
            pollfd names = {inotify_.get(), POLLIN, 0};
            while (!stop.stop_requested()) {
                if (poll(&names, 1, look_for_stop_ms) > 0) take_reports();
            }
        });
    }

    // When the daemon has ended: checks what it has left, and that nothing is missing.
    void finish(const std::vector<uint64_t>& counts) {
        thread_ = std::jthread();
        take_reports();
        EXPECT_EQ(report_paths().size(), 0U);
        check(parse(read_file("private/events")));
        for (size_t i = 0; i < counts.size(); ++i) {
            const uint64_t next = next_[i];
            expect_event_from({i, counts[i]});
            EXPECT_EQ(next, next_[i]) << "of client " << i;
        }
        const probe_values expected = values_after(counts);
        EXPECT_EQ(values_.counters, expected.counters);
        EXPECT_EQ(values_.texts, expected.texts);
        printf("%lu events in %lu reports\n", events_, reports_);
    }

 private:
    static constexpr int look_for_stop_ms = 50;

    // The next event of a client, whose messages before `id` are done with.
    void expect_event_from(event_id id) {
        while (kind_of(id) != "EV") ++id.number;
        next_[id.client] = id.number;
    }

    // Their names come in the order in which they were made.
    void take_reports() {
        alignas(inotify_event) std::array<char, 65536> names;
        const ssize_t size = read(inotify_.get(), names.data(), names.size());
        for (ssize_t at = 0; at < size;) {
            const auto* const found = reinterpret_cast<const inotify_event*>(names.data() + at);
            at += static_cast<ssize_t>(sizeof(inotify_event) + found->len);
            EXPECT_EQ(found->mask, uint32_t{IN_MOVED_TO});
            if (!std::string_view(found->name).starts_with("kiv_")) continue;
            const int number = std::stoi(found->name + strlen("kiv_"));
            EXPECT_TRUE(number == last_number_ + 1 || number == 1) << number;  // or all were gone
            last_number_ = number;
            const std::string path = std::string("output/") + found->name;
            check(parse(gunzip_file(path)));
            EXPECT_TRUE(std::filesystem::remove(path)) << path;
            ++reports_;
        }
    }

    void check(const kiv::Report& report) {
        EXPECT_NE(report.header().device_id(), "");
        for (const kiv::Event& event : report.events()) {
            if (!testing::Test::HasFailure()) check(event);
        }
        for (const auto& each : report.counters()) {
            if (each.package() == load_package) values_.counters[each.name()] = each.value();
        }
        for (const auto& each : report.statics()) {
            if (each.package() == load_package) values_.texts[each.name()] = each.value();
        }
    }

    void check(const kiv::Event& event) {
        const std::optional<event_id> id = find_event_id(event.package());
        if (!id) return;  // the daemon's own
        ASSERT_LT(id->client, next_.size()) << event.package();
        EXPECT_EQ(id->number, next_[id->client]) << "of client " << id->client;
        EXPECT_TRUE(is_intact(event.package(), event.payload())) << event.package();
        expect_event_from({id->client, id->number + 1});
        ++events_;
    }

    const unique_fd inotify_{inotify_init1(IN_CLOEXEC | IN_NONBLOCK)};
    std::vector<uint64_t> next_;  // the number of each client's event that comes next
    probe_values values_;         // as last reported
    int last_number_ = 0;
    uint64_t reports_ = 0;
    uint64_t events_ = 0;
    std::jthread thread_;  // last: it uses the others
};

}  // namespace kivd::soak
