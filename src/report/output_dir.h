// The directory output/: finished reports under their numbers, kept within two limits, their own
// size budget and the free space of the file system. Collectors take reports away at any moment;
// every change is one rename or unlink and every pass scans afresh.
#pragma once

#include <cstdint>
#include <optional>

namespace kivd {

inline constexpr uint64_t free_inodes_min = 8;

// Bytes that have to be free to make a report of the largest size.
[[nodiscard]] constexpr uint64_t compaction_space(uint32_t max_report_size) {
    constexpr uint64_t overhead = 256000;
    return 2 * (max_report_size + overhead);
}

// The size that all entries together stay below, each counted by its own size, directories and
// links too. Wraps in 32 bits when the limits are the wrong way round: then only free space counts.
[[nodiscard]] constexpr uint32_t output_size_budget(uint32_t max_output_dir_size,
                                                    uint32_t max_report_size) {
    return max_output_dir_size - max_report_size;
}

// Deletes the oldest reports until another one fits. Returns the highest report number left, 0 when
// there is none; nothing when room cannot be made, for which most reasons have been logged.
[[nodiscard]] std::optional<int32_t> prune_dir();

// The path of the report with that number, NUL-terminated.
struct report_path {
    explicit report_path(int64_t number);
    char text[64];
};

// The number of the report that follows the highest one; after 2147483647, the lowest that is free.
[[nodiscard]] int64_t next_report_number(int32_t highest);

// Deletes the report with that number, or with 0 every file but the configuration request.
void delete_reports(int32_t number);

}  // namespace kivd
