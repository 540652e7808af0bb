#include "report/output_dir.h"

#include <sys/stat.h>
#include <sys/statfs.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstring>
#include <optional>
#include <string_view>

#include "config/limits.h"
#include "diag/diag_store.h"
#include "format/report_name.h"
#include "platform/android_log.h"
#include "runtime/log_and_raise.h"
#include "util/directory.h"
#include "util/paths.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-compactor";
constexpr char remove_tag[] = "kivd-util";

struct entry_path {
    explicit entry_path(const char* name) {
        snprintf(text, sizeof text, "%s%s", paths::output_dir, name);
    }
    char text[sizeof paths::output_dir + NAME_MAX];
};

// Like for_each_entry, but leaves out "config_request".
bool for_each_output(auto function) {
    return for_each_entry(paths::output_dir, [&function](std::string_view name) {
        if (name != paths::config_request_name) function(name.data());
    });
}

struct report_entry {
    int32_t number;
    uint64_t size;
};

// A name that only begins like a report's has a number that is taken, but there is no such report
// to delete.
bool is_report(const char* name, int32_t number) {
    return std::string_view(name) == report_name(number).text;
}

struct directory_state {
    uint64_t total_size = 0;
    int32_t highest = 0;
    // The reports with the lowest numbers, in their order. There may be tens of thousands in all,
    // too many to look at each of them for every one that is deleted.
    std::array<report_entry, 256> oldest;
    size_t oldest_count = 0;

    void add(const report_entry& report) {
        if (oldest_count < oldest.size()) {
            ++oldest_count;
        } else if (oldest.back().number <= report.number) {
            return;
        }
        auto* const last = oldest.begin() + oldest_count - 1;
        auto* const place = std::ranges::upper_bound(oldest.begin(), last, report.number, {},
                                                     &report_entry::number);
        std::move_backward(place, last, last + 1);
        *place = report;
    }
};

bool scan_output_dir(directory_state& state) {
    const bool complete = for_each_output([&state](const char* name) {
        const entry_path path(name);
        struct stat status = {};
        if (lstat(path.text, &status) != 0) {
            __android_log_print(ANDROID_LOG_WARN, tag, "Failed to stat %s: %s", path.text,
                                strerror(errno));
            return;
        }
        const auto size = static_cast<uint64_t>(status.st_size);
        state.total_size += size;
        if (const std::optional<int32_t> number = scan_report_number(name)) {
            state.highest = std::max(state.highest, *number);
            if (is_report(name, *number)) state.add({*number, size});
            return;
        }
        __android_log_print(ANDROID_LOG_WARN, tag, "Bad file in our %s directory: %s",
                            paths::output_dir, name);
    });
    if (!complete) {
        log_and_raise(tag, "prune_dir(): get_statdir() failed: %s", strerror(errno));
    }
    return complete;
}

bool is_free_space_enough() {
    struct statfs status = {};
    if (statfs(paths::output_dir, &status) != 0) {
        return log_and_raise(tag, "is_free_space_enough(): statfs() failed: %s", strerror(errno));
    }
    const uint64_t needed = compaction_space(get_limits().max_report_size) + diag_space_reserve();
    const uint64_t available = static_cast<uint64_t>(status.f_bsize) * status.f_bavail;
    return needed <= available && (status.f_files == 0 || status.f_ffree >= free_inodes_min);
}

uint32_t size_budget() {
    return output_size_budget(get_limits().max_output_dir_size, get_limits().max_report_size);
}

bool is_room_enough(const directory_state& state) {
    return is_free_space_enough() && size_budget() > state.total_size;
}

void log_deleted(const char* log_tag, const char* path) {
    __android_log_print(ANDROID_LOG_INFO, log_tag, "Deleting %s from output directory", path);
}

// Deletes the oldest reports until there is room, or until one is already gone: collectors take
// them, too. False when the very first is gone.
bool delete_oldest(directory_state& state) {
    for (size_t i = 0; i < state.oldest_count; ++i) {
        if (i > 0 && is_room_enough(state)) return true;
        const report_path oldest(state.oldest[i].number);
        if (unlink(oldest.text) != 0) return i > 0;
        log_deleted(tag, oldest.text);
        state.total_size -= state.oldest[i].size;
    }
    return true;
}

void delete_all_entries() {
    (void)for_each_output([](const char* name) {
        const entry_path path(name);
        if (unlink(path.text) == 0) log_deleted(remove_tag, path.text);
    });
}

}  // namespace

report_path::report_path(int64_t number) {
    snprintf(text, sizeof text, "%s%s", paths::output_dir, report_name(number).text);
}

std::optional<int32_t> prune_dir() {
    for (;;) {
        directory_state state;
        if (!scan_output_dir(state)) return std::nullopt;
        if (is_room_enough(state)) return state.highest;
        if (state.oldest_count == 0) {
            log_and_raise(tag, "Failed to prune files from output directory");
            return std::nullopt;
        }
        if (!delete_oldest(state)) return std::nullopt;
    }
}

int64_t next_report_number(int32_t highest) {
    if (highest < INT32_MAX) return int64_t{highest} + 1;
    // The numbers have run out: take the lowest that is free.
    int64_t number = 1;
    while (access(report_path(number).text, F_OK) == 0) ++number;
    return number;
}

void delete_reports(int32_t number) {
    if (number == 0) return delete_all_entries();
    const report_path path(number);
    if (unlink(path.text) == 0) return log_deleted(remove_tag, path.text);
    __android_log_print(ANDROID_LOG_WARN, remove_tag, "Failed to delete %s : %s", path.text,
                        strerror(errno));
}

}  // namespace kivd
