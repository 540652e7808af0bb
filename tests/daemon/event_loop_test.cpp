#include "daemon/loop/event_loop.h"

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

}  // namespace
}  // namespace kivd
