// The system clock set under a running daemon. A preloaded library gives the daemon, and nothing
// else on the machine, the time that a file names.
#include <cstdlib>
#include <ctime>

#include "end_to_end/daemon_test.h"

namespace kivd {
namespace {

class clock_steps : public daemon_test {
 protected:
    clock_steps() {
        set_clock(0);
        const char* const sanitizer = getenv("ASAN_OPTIONS");
        const std::pair<const char*, std::string> variables[] = {
            {"FAKETIME_TIMESTAMP_FILE", directory + "/clock"},
            {"FAKETIME_NO_CACHE", "1"},
            {"FAKETIME_DONT_FAKE_MONOTONIC", "1"},
            {"ASAN_OPTIONS", (sanitizer ? sanitizer + ":"s : ""s) + "verify_asan_link_order=0"},
            {"LD_PRELOAD", FAKETIME_LIBRARY},
        };
        for (const auto& [name, value] : variables) setenv(name, value.c_str(), 1);
    }

    // A date and time: the clock stands still there. "+60" and "-60": seconds from the true time.
    static void set_clock(const std::string& time) {
        write_file("clock_new", time + "\n");
        std::filesystem::rename("clock_new", "clock");
    }
    static void set_clock(int64_t offset) {
        set_clock((offset < 0 ? "" : "+") + std::to_string(offset));
    }

    static bool is_saved(const std::string& counter) {
        return read_file("private/counters.txt").find("p\0"s + counter + '\0') != std::string::npos;
    }
};

TEST_F(clock_steps, a_jump_forward_makes_the_save_due_at_once) {
    constexpr int64_t day = 24 * 3600;  // what has not changed for an hour is not saved
    daemon_process daemon = start({{"-C", "-s", "86400", "-e", "3600"}});
    request({"CI p before 1", "SD p before x"});
    EXPECT_TRUE(daemon.wait_idle());
    set_clock(day);
    // In one packet: a connection would have it look at the clock before the request comes.
    EXPECT_TRUE(send_text(connect_client(socket_kind::datagram).get(), "CI p after 1"));
    EXPECT_TRUE(wait_until([] { return is_saved("after"); }));
    EXPECT_FALSE(is_saved("before"));
    request({"FL"});
    const kiv::Report report = wait_report(1);
    EXPECT_TRUE(exists("private/sdata.txt") && read_file("private/sdata.txt").empty());
    ASSERT_EQ(report.counters_size(), 2);
    EXPECT_EQ(report.counters(1).name(), "before");
    EXPECT_EQ(daemon.stop(), 0);
}

}  // namespace
}  // namespace kivd
