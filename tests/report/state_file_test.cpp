#include "report/state_file.h"
#include "record/header_record.h"

#include "config/limits.h"
#include "support/scratch_directory.h"
#include "util/clock.h"
#include "util/paths.h"

namespace kivd {
namespace {

class state_file : public scratch_directory {
 protected:
    // What is saved after a start with `text`.
    static std::string reloaded(const std::string& text) {
        limits_release();
        release_header();
        set_config_checksum({});
        write_file(paths::state, text);
        state_load();
        state_save();
        return read_file(paths::state);
    }
};

TEST_F(state_file, what_is_loaded_is_saved_again) {
    enable_test_mode();
    std::string text = doc_example("files.md", "text", "state-file");
    const std::string saved = reloaded(text);
    text.replace(text.find("shutdown-time: 1262325607"), 25, "shutdown-time: 1262325608");
    EXPECT_EQ(saved, text);
}

TEST_F(state_file, odd_lines_cost_no_more_than_their_value) {
    const std::string digits = "0123456789abcdef0123456789abcdef01234567";
    const struct {
        std::string loaded;
        std::string saved;
    } cases[] = {
        {"config-checksum: " + digits.substr(1), "config-checksum: " + std::string(40, '0')},
        {"config-checksum: ABCDEF" + std::string(34, 'a'),
         "config-checksum: 000000" + std::string(34, 'a')},
        {"product: " + std::string(240, 'p'), "product: " + std::string(63, 'p')},
        {"product: a\nproduct:", "product: a"},
        {"last-flush: 9223372036854775808", "last-flush: 9223372036854775807"},
        {"report-max-size: 4294967295", "report-max-size: 2147483647"},
        {"data-collection: 12", "data-collection: 1"},
        {"error_nr: 99999999999", "error_nr: 2147483647"},
        {"group_id: A\ngroup_id: A\ngroup_id:\ngroup_id: B", "group_id: A\ngroup_id: B"},
        {"unknown: x\n: \n\n" + "\0product: z"s, "product: unknown"},
        {std::string(1 << 20, 'x'), "build_type: unknown"},
    };
    for (const auto& [loaded, saved] : cases) {
        SCOPED_TRACE(loaded.substr(0, 100));
        const std::string all = reloaded("variant: 1\n" + loaded + "\nsw_version: 2\n");
        EXPECT_NE(all.find("\nsw_version: 2\nvariant: 1\n"), std::string::npos);
        EXPECT_NE(("\n" + all).find("\n" + saved + "\n"), std::string::npos);
    }
}

TEST_F(state_file, a_full_device_keeps_the_old_one) {
    const std::string old = read_file(paths::state);
    fs::create_symlink("/dev/full", paths::state_new);
    state_save();
    EXPECT_EQ(take_log().back(),
              "E kivd-util: Failed to write new configuration file: No space left on device");
    EXPECT_EQ(read_file(paths::state), old);
    EXPECT_FALSE(exists(paths::state_new));
    fs::remove(paths::state);
    fs::create_directories(paths::state + "/old"s);
    state_save();
    EXPECT_EQ(take_log().back(),
              "E kivd-util: Failed to rename configuration file: Is a directory");
}

}  // namespace
}  // namespace kivd
