#include "list/list_file.h"

#include "support/scratch_directory.h"

namespace kivd {
namespace {

const std::string end = "\0\0\n"s;

struct item : probe_key {};

bool write_record(list_writer& writer, const item& each) {
    writer.text(each.package);
    return writer.end_record();
}

// A list whose records are one text each.
class list_file : public scratch_directory {
 protected:
    // What loading a file of `bytes` gives: its result, and the number of records.
    std::pair<bool, uint32_t> load(const std::string& bytes) {
        write_file("list", bytes);
        list.clear();
        const bool complete = list_load(list, "list", [](std::string_view record) {
            return make_entry<item>({record.data(), ""});
        });
        return {complete, list.size()};
    }

    sorted_list<item> list{100};
};

TEST_F(list_file, records_and_files_have_their_limits) {
    const std::string longest = std::string(1021, 'x') + end;
    std::string many;
    for (int i = 0; i < 200; ++i) many += longest + "a" + end;  // across the edges of any buffer
    EXPECT_EQ(load(many), std::pair(true, 400U));
    EXPECT_EQ(load(many + "x" + longest), std::pair(false, 400U));
    for (int i = 400; i < 19999; ++i) many += "a" + end;
    EXPECT_EQ(load(many), std::pair(true, 19999U));
    EXPECT_EQ(load(many + longest + longest), std::pair(false, 20000U));
}

TEST_F(list_file, a_failed_save_keeps_the_old_file_and_no_other) {
    const auto fill_device = [] { fs::create_symlink("/dev/full", "list_"); };
    const struct {
        int records;
        void (*obstruct)();
        const char* message;
    } cases[] = {
        {1, fill_device, "E kivd-list: Failed to save data to list file."},  // at the close
        {19999, fill_device, "E kivd-list: Failed to save data to list file."},
        {1, [] { fs::remove("list") && fs::create_directories("list/old"); },
         "E kivd-list: Failed to rename file list_ to list: Is a directory"},
    };
    for (const auto& [records, obstruct, message] : cases) {
        SCOPED_TRACE(message);
        std::string old;
        for (int i = 0; i < records; ++i) old += "old" + end;
        (void)load(old);
        obstruct();
        EXPECT_FALSE(list_save(list, "list", write_record));
        EXPECT_EQ(take_log(), lines{message});
        EXPECT_TRUE(fs::is_directory("list") || read_file("list") == old);
        EXPECT_FALSE(exists("list_"));

        fs::remove_all("list");
        EXPECT_TRUE(list_save(list, "list", write_record));
        EXPECT_EQ(read_file("list"), old);
    }
}

}  // namespace
}  // namespace kivd
