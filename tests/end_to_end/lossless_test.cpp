// Events under the hardest end.
#include <csignal>
#include <random>

#include "daemon_test.h"

namespace kivd {
namespace {

class lossless : public daemon_test {};

std::vector<std::string> payloads_of(const kiv::Report& report) {
    std::vector<std::string> payloads;
    for (const kiv::Event& event : report.events()) payloads.push_back(event.payload());
    return payloads;
}

std::string numbered(int number, size_t size) {
    std::string text = std::to_string(number);
    return text.insert(0, size - text.size(), ' ');
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
