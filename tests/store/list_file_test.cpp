#include "list/list_file.h"

#include "support/scratch_directory.h"

namespace kivd {
namespace {

const std::string end = "\0\0\n"s;

int write_record(FILE* file, const void* element, void* /*context*/) {
    record_writer writer(file);
    writer.text(static_cast<const probe_key*>(element)->package);
    return writer.finish() ? 1 : 0;
}

// A list whose records are one text each.
class list_file : public scratch_directory {
 protected:
    ~list_file() override { list_destroy(list); }

    // What loading a file of `bytes` gives: its result, and the number of records.
    std::pair<int, uint32_t> load(const std::string& bytes) {
        write_file("list", bytes);
        list_destroy(list);
        list = list_create(0, 100, compare_probes, nullptr);
        const auto parse = [](const char* record, const char*, void*) {
            return new_probe_element(sizeof(probe_key), {record, ""});
        };
        const int result = list_load(*list, "list", parse, nullptr);
        return {result, list->count};
    }

    sorted_list* list = nullptr;
};

TEST_F(list_file, records_and_files_have_their_limits) {
    const std::string longest = std::string(1021, 'x') + end;
    std::string many;
    for (int i = 0; i < 200; ++i) many += longest + "a" + end;  // across the edges of any buffer
    EXPECT_EQ(load(many), std::pair(1, 400U));
    EXPECT_EQ(load(many + "x" + longest), std::pair(0, 400U));
    for (int i = 400; i < 19999; ++i) many += "a" + end;
    EXPECT_EQ(load(many), std::pair(1, 19999U));
    EXPECT_EQ(load(many + longest + longest), std::pair(0, 20000U));
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
        EXPECT_EQ(list_save(*list, "list", write_record, nullptr), 0);
        EXPECT_EQ(take_log(), lines{message});
        EXPECT_TRUE(fs::is_directory("list") || read_file("list") == old);
        EXPECT_FALSE(exists("list_"));

        fs::remove_all("list");
        EXPECT_EQ(list_save(*list, "list", write_record, nullptr), 1);
        EXPECT_EQ(read_file("list"), old);
    }
}

}  // namespace
}  // namespace kivd
