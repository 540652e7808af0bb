// Numbers out of repeated measurements, and the table in which they are printed.
#pragma once

#include <cstdint>
#include <vector>

namespace kivd::bench {

// The monotonic clock.
[[nodiscard]] int64_t now_ns();

// 0 for no values at all. A percentile is the smallest value that so many percent of the values
// don't exceed.
[[nodiscard]] double median(std::vector<double> values);
[[nodiscard]] double percentile(std::vector<double> values, double percent);

// Value by value; both have the same length. Rounds that lie next to each other in time are
// compared with each other, so that a slow minute of the machine slows both sides.
[[nodiscard]] std::vector<double> ratios(const std::vector<double>& of,
                                         const std::vector<double>& to);

enum class bound { none, at_most, at_least };
struct goal {
    bound kind = bound::none;
    double limit = 0;
};

// One section of the table and its head line.
void print_section(const char* title);

// One line: the median of `samples`, the smallest and the largest, the goal, median / goal. Lines
// without a goal are there to show what the ratios are made of.
void print_row(const char* measure, const std::vector<double>& samples, const char* unit,
               goal wanted = {});

// A remark below the lines.
[[gnu::format(printf, 1, 2)]] void print_note(const char* format, ...);

// Says on standard error what went wrong and ends the process with status 1.
[[noreturn]] [[gnu::format(printf, 1, 2)]] void give_up(const char* format, ...);

}  // namespace kivd::bench
