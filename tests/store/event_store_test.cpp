#include "store/events.h"

#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <optional>
#include <utility>

#include "config/limits.h"
#include "record/event_record.h"
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
        static const std::string payload = "\x01\xFF";
        return events_add("app", "start", payload);
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

// Whatever is cut off, a batch leaves the file and the log that its events leave one by one.
TEST_F(event_store, a_batch_is_its_events_one_by_one_wherever_a_device_is_full) {
    const std::string large(50, 'x');
    const auto add_some = [&](size_t free_bytes, bool together) {
        (void)unlink(paths::events);
        restart();
        (void)add();
        limit_file_size(header.size() + event.size() + free_bytes);
        std::optional<event_batch> batch;
        if (together) batch.emplace();
        (void)add();
        (void)events_add("large", "event", large);
        (void)add();
        (void)events_add("a", "b", {});
        EXPECT_EQ(together, together && read_file(paths::events) == header + event);
        batch.reset();
        limit_file_size(RLIM_INFINITY);
        return std::pair(read_file(paths::events), take_log());
    };
    for (size_t free_bytes = 0; free_bytes < 150; ++free_bytes) {
        SCOPED_TRACE(free_bytes);
        const auto [file, log] = add_some(free_bytes, false);
        EXPECT_TRUE(file.starts_with(header + event));
        EXPECT_LE(file.size(), header.size() + event.size() + free_bytes);
        EXPECT_EQ(add_some(free_bytes, true), std::pair(file, log));
        if (free_bytes >= event.size()) continue;
        EXPECT_EQ(log.front(),
                  "E kivd-events: Failed to write event app::start with 2 bytes "
                  "payload. Error: File too large");
    }
}

TEST_F(event_store, a_batch_is_written_before_anything_looks_at_the_file) {
    const auto exit_within_batch = [] {
        const event_batch batch;
        for (size_t i = 0; i <= max_events_a_write; ++i) (void)add();
        exit(0);
    };
    EXPECT_EXIT(exit_within_batch(), testing::ExitedWithCode(0), "");
    EXPECT_EQ(read_file(paths::events).size(), header.size() + 17 * event.size());
    (void)unlink(paths::events);
    get_limits().max_report_size = static_cast<uint32_t>(header.size() + 3 * event.size());
    {
        const event_batch batch;
        EXPECT_EQ(add(), event_file::open);
        EXPECT_EQ(add(), event_file::open);
        EXPECT_EQ(add(), event_file::full);
        EXPECT_EQ(read_file(paths::events), header + event + event + event);
        EXPECT_TRUE(events_flush());
        EXPECT_EQ(add(), event_file::open);
        EXPECT_TRUE(events_flush());
        EXPECT_EQ(read_file(paths::flushed_data), header + event);
        (void)add();
        if (const pid_t child = fork(); child == 0) exit(0);
        (void)wait(nullptr);
        EXPECT_EQ(read_file(paths::events), header) << "a child has stored what is its parent's";
    }
}

TEST_F(event_store, a_link_stays_when_there_is_no_room_for_a_header) {
    fs::create_symlink("../elsewhere", paths::events);
    limit_file_size(header.size() - 1);
    (void)add();
    EXPECT_FALSE(events_flush());
    EXPECT_EQ(read_file("elsewhere"), "");
    EXPECT_EQ(unlink(paths::events), 0);
    (void)add();
    EXPECT_FALSE(fs::exists(paths::events));  // a file of its own goes instead
    fs::create_symlink("../elsewhere", paths::events);
    limit_file_size(RLIM_INFINITY);
    (void)add();
    EXPECT_EQ(read_file("elsewhere"), header + event);
}

}  // namespace
}  // namespace kivd
