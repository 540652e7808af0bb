// Events under full load, and under the hardest end.
#include <atomic>
#include <csignal>
#include <random>
#include <thread>

#include "daemon_test.h"

namespace kivd {
namespace {

class lossless : public daemon_test {};

std::vector<std::string> payloads_of(const kiv::Report& report) {
    std::vector<std::string> payloads;
    for (const kiv::Event& event : report.events()) payloads.push_back(event.payload());
    return payloads;
}

void append(std::vector<std::string>& to, const std::vector<std::string>& more) {
    to.insert(to.end(), more.begin(), more.end());
}

std::string numbered(int number, size_t size) {
    std::string text = std::to_string(number);
    return text.insert(0, size - text.size(), ' ');
}

// Takes reports away as they appear, until it is told that there will be no more.
class collector {
 public:
    ~collector() { finish(); }
    std::vector<std::string> finish() {
        last_ = true;
        if (thread_.joinable()) thread_.join();
        return std::move(payloads_);
    }
    int reports() const { return reports_; }

 private:
    void run() {
        for (bool last = false; !last;) {
            last = last_;
            for (const auto& [number, path] : report_paths()) {
                append(payloads_, payloads_of(parse(gunzip_file(path))));
                std::filesystem::remove(path);
                ++reports_;
            }
        }
    }

    std::vector<std::string> payloads_;
    std::atomic<int> reports_ = 0;
    std::atomic<bool> last_ = false;
    std::thread thread_{[this] { run(); }};
};

TEST_F(lossless, a_producer_at_full_speed_and_a_collector_see_every_event_once_and_in_order) {
    constexpr int count = 60000;
    daemon_process daemon = start();
    collector collector;
    {
        const unique_fd producer = connect_client(socket_kind::datagram);
        for (int i = 0; i < count; ++i) {
            ASSERT_TRUE(send_text(producer.get(), "EV load event " + numbered(i, 64)));
        }
        ASSERT_TRUE(wait_taken(producer.get()));
    }
    EXPECT_EQ(daemon.stop(), 0);  // when the last report is done
    EXPECT_EQ(errors(daemon), 0U) << daemon.log();
    std::vector<std::string> payloads = collector.finish();
    EXPECT_GT(collector.reports(), 10);
    append(payloads, payloads_of(parse(read_file("private/events"))));
    ASSERT_EQ(payloads.size(), size_t{count});
    for (int i = 0; i < count; ++i) ASSERT_EQ(payloads[static_cast<size_t>(i)], numbered(i, 64));
}

// Killed at different points of a rotation; an answered IA says that what came before it is kept.
TEST_F(lossless, what_was_acknowledged_outlives_a_kill) {
    std::minstd_rand random(1);
    for (int round = 0; round < 12; ++round) {
        SCOPED_TRACE(round);
        daemon_process daemon = start();
        const unique_fd client = connect_client(socket_kind::packets);
        const int acknowledged = 280 + static_cast<int>(random() % 40);
        for (int i = 0; i < acknowledged; ++i) {
            ASSERT_TRUE(send_text(client.get(), "EV p event " + numbered(i, 1300)));
        }
        ASSERT_EQ(ask(client.get(), "IA"), "1");
        const int sent = acknowledged + static_cast<int>(random() % 40);
        for (int i = acknowledged; i < sent; ++i) {
            ASSERT_TRUE(send_text(client.get(), "EV p event " + numbered(i, 1300)));
        }
        daemon.send_signal(SIGKILL);
        ASSERT_EQ(daemon.wait_exit(), 128 + SIGKILL);

        daemon = start();
        int expected = 0;
        for (const std::string& payload : payloads_of(everything_kept())) {
            EXPECT_EQ(std::stoi(payload), expected++);
        }
        EXPECT_GE(expected, acknowledged);
        EXPECT_EQ(daemon.stop(), 0);
        EXPECT_EQ(errors(daemon), 0U) << daemon.log();
        remove_everything_kept();
    }
}

}  // namespace
}  // namespace kivd
