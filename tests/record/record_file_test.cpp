#include "record/record_file.h"

#include <fcntl.h>
#include <unistd.h>

#include "support/scratch_directory.h"
#include "util/paths.h"

namespace kivd {
namespace {

class record_file : public scratch_directory {};

TEST_F(record_file, records_may_begin_beyond_4_gib) {
    constexpr off_t record_size = 0x4000'0000 + 6;
    const std::string header = doc_example("report-format.md", "hex", "header-record");
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

TEST_F(record_file, one_that_cannot_be_opened_is_told_and_a_missing_one_is_fine) {
    rescue_event_file(paths::events, record_header::expected);
    EXPECT_EQ(take_log(), lines());
    fs::create_symlink("events", paths::events);
    rescue_event_file(paths::events, record_header::expected);
    EXPECT_EQ(take_log(), lines{"E kivd-util: Failed to open event file <private/events> to "
                                "rescue: Too many levels of symbolic links"});
}

}  // namespace
}  // namespace kivd
