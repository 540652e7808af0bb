#include "daemon/loop/event_loop.h"

#include <sys/socket.h>

#include <thread>

#include "runtime/stop.h"
#include "support/scratch_directory.h"

namespace kivd {
namespace {

class event_loop : public scratch_directory {};

// A signal would end its wait in any case.
TEST_F(event_loop, ends_when_another_thread_asks_for_the_stop) {
    ASSERT_TRUE(stop_init());
    ASSERT_TRUE(event_loop_init());
    std::thread other([] {
        std::this_thread::sleep_for(std::chrono::milliseconds(50));  // it waits by then, or not
        request_stop();
    });
    event_loop_run();
    EXPECT_TRUE(is_stop_requested());
    other.join();
}

TEST_F(event_loop, looks_for_the_stop_between_two_events_of_a_wait) {
    ASSERT_TRUE(stop_init());
    ASSERT_TRUE(event_loop_init());
    static int calls = 0;
    const auto stop = [](event_handler& /*handler*/) {
        ++calls;
        request_stop();
    };
    int ends[2];
    ASSERT_EQ(socketpair(AF_UNIX, SOCK_DGRAM, 0, ends), 0);
    event_handler handlers[] = {{stop, ends[0]}, {stop, ends[1]}};
    for (event_handler& each : handlers) {
        EXPECT_EQ(send(each.fd, "", 1, 0), 1);
        EXPECT_TRUE(event_loop_add(each));
    }
    event_loop_run();
    EXPECT_EQ(calls, 1);
}

}  // namespace
}  // namespace kivd
