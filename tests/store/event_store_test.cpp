#include "store/events.h"

#include "config/limits.h"
#include "support/scratch_directory.h"
#include "util/clock.h"
#include "util/paths.h"

namespace kivd {
namespace {

class event_store : public scratch_directory {
 protected:
    event_store() {
        enable_test_mode();
        restart();
    }
    // Adds the documented event.
    static event_file add() {
        set_test_clock(1262325600);
        return events_add("app", "start", "\x01\xFF"s);
    }

    const std::string header = doc_example("report-format.md", "hex", "header-record");
    const std::string event = doc_example("report-format.md", "hex", "event-record");
};

TEST_F(event_store, a_file_has_one_header_and_is_full_at_its_limit) {
    get_limits().max_report_size = 188;
    EXPECT_EQ(add(), event_file::open);  // 187 bytes
    get_limits().max_report_size = 212;
    EXPECT_EQ(add(), event_file::full);
    EXPECT_TRUE(events_flush());
    EXPECT_EQ(read_file(paths::flushed_data), header + event + event);
    write_file(paths::events, header + event);  // as a restart finds it
    get_limits().max_report_size = 213;
    EXPECT_EQ(add(), event_file::open);
    EXPECT_EQ(events_add("a", "b", {}), event_file::full);
    EXPECT_EQ(read_file(paths::events).substr(0, 212), header + event + event);
}

TEST_F(event_store, a_torn_event_is_cut_off) {
    (void)add();
    for (rlim_t written = 0; written < event.size(); ++written) {
        limit_file_size(header.size() + event.size() + written);
        (void)add();
        EXPECT_EQ(take_log(), lines{"E kivd-events: Failed to write event app::start with 2 bytes "
                                    "payload. Error: File too large"});
        EXPECT_EQ(read_file(paths::events), header + event);
        (void)take_log();
    }
}

TEST_F(event_store, a_link_stays_when_there_is_no_room_for_a_header) {
    fs::create_symlink("../elsewhere", paths::events);
    limit_file_size(header.size() - 1);
    (void)add();
    EXPECT_FALSE(events_flush());
    EXPECT_EQ(read_file("elsewhere"), "");
    limit_file_size(RLIM_INFINITY);
    (void)add();
    EXPECT_EQ(read_file("elsewhere"), header + event);
}

}  // namespace
}  // namespace kivd
