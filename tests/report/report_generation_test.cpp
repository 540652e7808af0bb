#include "report/report_generation.h"

#include <sys/wait.h>

#include "record/header_record.h"
#include "report/state_file.h"
#include "security/key_paths.h"
#include "store/counters.h"
#include "store/events.h"
#include "store/static_data.h"
#include "support/config_package.h"
#include "support/scratch_directory.h"
#include "util/clock.h"
#include "util/paths.h"

namespace kivd {
namespace {

class report_generation : public scratch_directory {};

TEST_F(report_generation, all_files_have_the_documented_bytes) {
    enable_test_mode();
    restart();
    constexpr int64_t start = 1262325600;  // each look at the clock is a second later
    set_test_clock(start);
    (void)events_add("app", "start", "\x01\xFF"s);
    set_test_clock(start);
    counters_update("app", "starts", 5, counter_mode::increment, 0);
    set_test_clock(start + 2);
    counters_update("app", "starts", -7, counter_mode::increment, 0);
    set_test_clock(start + 4);
    for (int i = 0; i < 2; ++i) static_data_set("app", "mode", "night, auto", 0);
    set_test_clock(start + 4);
    (void)events_add("a", "b", {});
    counters_save();
    static_data_save();
    EXPECT_EQ(read_file(paths::counters), doc_example("files.md", "hex", "counters-file"));
    EXPECT_EQ(read_file(paths::static_data), doc_example("files.md", "hex", "sdata-file"));

    const auto documented = [](const char* name) {
        return doc_example("report-format.md", "hex", name);
    };
    const std::string report = next_report();
    EXPECT_TRUE(report.starts_with(documented("header-record") + documented("event-record")));
    EXPECT_TRUE(report.ends_with(documented("counter-record") + documented("static-record")));
    const auto empty = get_empty_report_header();
    EXPECT_EQ(std::string(empty.begin(), empty.end()), documented("empty-header-record"));
}

TEST_F(report_generation, each_report_has_what_came_since_the_last_one) {
    EXPECT_FALSE(generate_report());
    EXPECT_EQ(take_log(), lines{});
    counters_update("p", "c1", 1, counter_mode::set, 0);
    const std::string payload(5000, 'x');
    (void)events_add("p", "e0", payload);
    EXPECT_EQ(contents(next_report()), "P1; e0 " + payload + "; c1=1; ");
    EXPECT_LT(fs::file_size("output/kiv_1"), 500U);
    for (const int64_t flushed = now_ms(); now_ms() == flushed;) {
    }
    set_last_flush(now_ms());  // it may have been the counter's own millisecond

    set_output_compression(false);
    (void)events_add("p", "e1", payload);
    (void)events_add("p", "e2", {});
    EXPECT_EQ(contents(next_report()), "P1; e1 " + payload + "; e2 ; ");
    EXPECT_GT(fs::file_size("output/kiv_2"), 5000U);

    write_file(paths::header_info, "");
    EXPECT_EQ(contents(next_report()), "P1; ");  // every flush makes one now
    EXPECT_FALSE(exists(paths::flushed_data) || exists(paths::compacted_data));
}

TEST_F(report_generation, a_failed_compactor_leaves_its_data_and_no_report) {
    (void)events_add("p", "e", {});
    fs::create_symlink("/dev/full", paths::compacted_data);
    EXPECT_TRUE(generate_report());
    int status = 0;
    EXPECT_GT(wait(&status), 0);
    EXPECT_EQ(WEXITSTATUS(status), 1);
    EXPECT_TRUE(fs::remove(paths::compacted_data) && fs::is_empty("output"));
    EXPECT_TRUE(compact_report());
    EXPECT_TRUE(exists("output/kiv_1"));
}

TEST_F(report_generation, the_output_may_be_on_a_file_system_of_its_own) {
    std::string elsewhere = "/dev/shm/kivd-XXXXXX";
    ASSERT_NE(mkdtemp(elsewhere.data()), nullptr);
    fs::remove("output");
    fs::create_directory_symlink(elsewhere, "output");
    (void)events_add("p", "e", "x"s);
    EXPECT_EQ(contents(next_report()), "P1; e x; ");
    EXPECT_FALSE(exists(paths::compacted_data) || exists(paths::new_report));
    fs::remove_all(elsewhere);
}

TEST_F(report_generation, a_report_that_cannot_be_sealed_whole_does_not_appear) {
    make_keys("report");
    set_report_key_dir("./");
    set_output_compression(false);
    (void)events_add("p", "e", std::string(5000, 'x'));
    EXPECT_TRUE(events_flush());
    const auto size = fs::file_size(paths::flushed_data);
    const std::pair<rlim_t, const char*> limits[] = {
        {size + 100, "E kivd/crypto: encrypt_file(): fwrite() failed, File too large"},
        {100, "E kivd-compactor: Failed to compact file"},
    };
    for (const auto& [limit, message] : limits) {
        limit_file_size(limit);
        EXPECT_FALSE(compact_report());
        EXPECT_EQ(take_log().back(), message);
        EXPECT_TRUE(fs::is_empty("output"));
    }
    limit_file_size(RLIM_INFINITY);
    EXPECT_TRUE(compact_report());
    EXPECT_TRUE(exists("output/kiv_1") && !exists(paths::flushed_data));
}

}  // namespace
}  // namespace kivd
