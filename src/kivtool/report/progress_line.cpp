#include "kivtool/report/progress_line.h"

namespace kivd {
namespace {
constexpr uint64_t records_between_looks = 4096;  // at the clock
constexpr std::chrono::milliseconds time_between_lines(200);
constexpr char erase_line[] = "\r\x1b[K";
}  // namespace

void progress_line::show(size_t files_done, size_t files, uint64_t records) {
    if (!terminal_ || records % records_between_looks != 0 || clock::now() < due_) return;
    due_ = clock::now() + time_between_lines;
    *terminal_ << erase_line << files_done << " of " << files << " files, " << records << " records"
               << std::flush;
    is_shown_ = true;
}

void progress_line::clear() {
    if (!is_shown_) return;
    *terminal_ << erase_line << std::flush;
    is_shown_ = false;
}

}  // namespace kivd
