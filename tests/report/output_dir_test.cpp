#include "report/output_dir.h"

#include <sys/stat.h>

#include <algorithm>

#include "config/limits.h"
#include "support/scratch_directory.h"

namespace kivd {
namespace {

class output_dir : public scratch_directory {
 protected:
    // Leaves files of 100 bytes each under these names, and room for `room` bytes.
    static void prepare(const lines& names, uint32_t room) {
        get_limits().max_output_dir_size = get_limits().max_report_size + room;
        for (const auto& entry : fs::directory_iterator("output")) fs::remove_all(entry);
        for (const std::string& name : names) {
            write_file("output/" + name, std::string(100, 'x'));
        }
    }
    static lines names() {
        lines all;
        for (const auto& entry : fs::directory_iterator("output")) {
            all.push_back(entry.path().filename());
        }
        std::ranges::sort(all);
        return all;
    }
};

TEST_F(output_dir, the_lowest_numbers_go_until_there_is_room) {
    const struct {
        lines before;
        uint32_t room;
        int32_t highest;
        lines after;
    } cases[] = {
        {{}, 0, -1, {}},
        {{"kiv_3", "kiv_7"}, 201, 7, {"kiv_3", "kiv_7"}},
        {{"kiv_3", "kiv_7"}, 200, 7, {"kiv_7"}},
        {{"kiv_10", "kiv_9"}, 101, 10, {"kiv_10"}},  // numbers, not names
        {{"kiv_3", "kiv_7"}, 100, 0, {}},
        {{"bad", "kiv_3"}, 101, 0, {"bad"}},
        {{"bad", "kiv_", "kiv_disabled"}, 300, -1, {"bad", "kiv_", "kiv_disabled"}},
        {{"kiv_-5", "kiv_1"}, 101, 1, {"kiv_1"}},
        {{"kiv_12abc", "kiv_3"}, 101, 12, {"kiv_12abc"}},
        {{"kiv_1.part", "kiv_12abc", "kiv_13"}, 201, 12, {"kiv_1.part", "kiv_12abc"}},
        {{"kiv_007"}, 100, -1, {"kiv_007"}},
        {{"kiv_99999999999"}, 101, 1215752191, {"kiv_99999999999"}},
        {{"kiv_2147483647"}, 101, 2147483647, {"kiv_2147483647"}},
        {{"kiv_1", "kiv_2"}, UINT32_MAX, 2, {"kiv_1", "kiv_2"}},  // no limit, then
    };
    for (const auto& [before, room, highest, after] : cases) {
        SCOPED_TRACE(testing::PrintToString(before) + " " + std::to_string(room));
        prepare(before, room);
        EXPECT_EQ(prune_dir().value_or(-1), highest);
        EXPECT_EQ(names(), after);
    }
    EXPECT_EQ(next_report_number(2147483647), 3);
    EXPECT_EQ(next_report_number(2147483646), 2147483647);
}

TEST_F(output_dir, a_great_many_go_in_their_order) {
    lines all;
    for (int number = 700; number > 0; --number) all.push_back("kiv_" + std::to_string(number));
    prepare(all, 3001);
    (void)take_log();
    EXPECT_EQ(prune_dir(), 700);
    const lines log = take_log();
    ASSERT_EQ(log.size(), 670U);
    for (size_t i = 0; i < log.size(); ++i) {
        EXPECT_EQ(log[i], "I kivd-compactor: Deleting output/kiv_" + std::to_string(i + 1) +
                              " from output directory");
    }
}

TEST_F(output_dir, only_reports_in_the_directory_are_removed) {
    write_file("precious", "x");
    prepare({}, 5);  // enough for the file, but not for the link
    fs::create_symlink("../precious", "output/kiv_4");
    EXPECT_EQ(prune_dir(), 0);
    EXPECT_TRUE(exists("precious") && !exists("output/kiv_4"));
    prepare({"kiv_2"}, 100);
    EXPECT_EQ(mkfifo("output/kiv_1", 0600), 0);
    EXPECT_EQ(prune_dir(), 0);
    prepare({"kiv_4"}, 100);
    fs::create_directory("output/kiv_3");
    EXPECT_EQ(prune_dir(), std::nullopt);
    EXPECT_TRUE(exists("output/kiv_4"));
    prepare({"bad", "config_request", "kiv_1", "kiv_2", "kiv_disabled"}, 1);
    for (const int number : {1, 1, -1}) delete_reports(number);
    EXPECT_EQ(names(), (lines{"bad", "config_request", "kiv_2", "kiv_disabled"}));
    delete_reports(0);
    EXPECT_EQ(names(), lines{"config_request"});
}

}  // namespace
}  // namespace kivd
