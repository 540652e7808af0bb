// A line on a terminal that shows the progress of a long job, and is erased before anything else is
// written.
#pragma once

#include <chrono>
#include <cstdint>
#include <ostream>
#include <string>

namespace kivd {

class progress_line {
 public:
    // Null shows nothing.
    explicit progress_line(std::ostream* terminal) : terminal_(terminal) {}
    ~progress_line() { clear(); }
    progress_line(const progress_line&) = delete;
    progress_line& operator=(const progress_line&) = delete;

    // May be called often: it updates the line only now and then.
    void show(size_t files_done, size_t files, uint64_t records);
    void clear();

 private:
    using clock = std::chrono::steady_clock;

    std::ostream* terminal_;
    bool is_shown_ = false;
    clock::time_point due_ = clock::now() + std::chrono::milliseconds(500);
};

}  // namespace kivd
