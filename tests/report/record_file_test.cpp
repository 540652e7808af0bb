#include "record/record_file.h"

#include <fcntl.h>
#include <unistd.h>

#include "support/scratch_directory.h"
#include "util/paths.h"

namespace kivd {
namespace {

class record_file : public scratch_directory {
 protected:
    // What is left of `bytes` by the rescue; "gone" for no file.
    static std::string rescued(const std::string& bytes,
                               record_header first = record_header::expected) {
        write_file(paths::events, bytes);
        rescue_event_file(paths::events, first);
        return exists(paths::events) ? read_file(paths::events) : "gone";
    }

    const std::string header = doc_example("report-format.md", "hex", "header-record");
    const std::string event = doc_example("report-format.md", "hex", "event-record");
};

TEST_F(record_file, what_is_no_event_ends_the_file) {
    for (const std::string& bad : {
             "\x12\xFF\xFF\xFF\xFF\x0F zzzzzz"s,  // a length of -1
             "\x12\xFF\xFF\xFF\xFF\x07 zzzzzz"s,  // 2 GiB
             "\x12\xFA\xFF\xFF\xFF\x0F zzzzzz"s,  // a size that wraps to 0
             "\x12\x80\x80\x80\x80\x80 zzzzzz"s,  // a length without an end
             doc_example("report-format.md", "hex", "counter-record"),
             std::string(100, '\0'),
         }) {
        SCOPED_TRACE(testing::PrintToString(bad));
        EXPECT_EQ(rescued(header + event + bad + event), header + event);
        EXPECT_EQ(rescued(event + bad, record_header::absent), event);
        EXPECT_EQ(rescued(bad + header), "gone");
    }
    EXPECT_EQ(rescued("", record_header::absent), "");
}

TEST_F(record_file, records_may_begin_beyond_4_gib) {
    constexpr off_t record_size = 0x4000'0000 + 6;
    off_t size = std::ssize(header);
    write_file(paths::events, header);
    const unique_fd fd(open(paths::events, O_WRONLY | O_CLOEXEC));
    for (int i = 0; i < 6; ++i, size += record_size) {  // the last one is torn; all are holes
        EXPECT_EQ(pwrite(fd.get(), "\x12\x80\x80\x80\x80\x04", 6, size), 6);
    }
    EXPECT_EQ(ftruncate(fd.get(), size - 1), 0);
    rescue_event_file(paths::events, record_header::expected);
    EXPECT_EQ(fs::file_size(paths::events), static_cast<uint64_t>(size - record_size));
}

TEST_F(record_file, records_that_cannot_be_written_are_left_out_whole) {
    const unique_fd fd(open("records", O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600));
    record_appender records(fd.get(), 0);
    const auto append = [&records](int count, uint8_t byte) {
        const std::vector<uint8_t> record(346, byte);
        for (int i = 0; i < count; ++i) records.append(record, "tag");
        records.flush("tag");
    };
    append(100, 'a');
    limit_file_size(34600 + 100);
    append(10, 'b');
    limit_file_size(RLIM_INFINITY);
    append(1, 'c');
    EXPECT_EQ(read_file("records"), std::string(34600, 'a') + std::string(346, 'c'));
    EXPECT_EQ(take_log(), lines{"E tag: Failed to write PB to file: File too large"});
}

}  // namespace
}  // namespace kivd
