#include "diag/diag_files.h"

#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstring>
#include <optional>
#include <string_view>
#include <utility>

#include "platform/android_log.h"
#include "runtime/log_and_raise.h"
#include "util/directory.h"
#include "util/file_io.h"
#include "util/paths.h"
#include "util/text_scan.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-qz";

// The numbers that the last client request found: they still answer when the directory is gone.
constinit diag_numbers exported = {};

// Reads a name as scanf does with "q%*c_%d": what follows the number does not matter.
std::optional<int32_t> diag_number(std::string_view name) {
    if (name.size() < 3 || name[0] != 'q' || name[2] != '_') return std::nullopt;
    const std::optional<int64_t> number = scan_number(name.data() + 3);
    return number ? std::optional(static_cast<int32_t>(*number)) : std::nullopt;
}

void delete_entry(const char* path) {
    if (unlink(path) == 0 || errno == ENOENT) return;
    log_and_raise(tag, "Failed to delete %s, <%s>", path, strerror(errno));
}

}  // namespace

diag_path::diag_path(char letter, int32_t number) {
    snprintf(text, sizeof text, "%sq%c_%d", paths::diag_dir, letter, number);
}

bool scan_diag_files(diag_numbers& numbers) {
    diag_numbers found = {1, INT32_MAX};
    const bool scanned = for_each_entry(paths::diag_dir, [&found](std::string_view name) {
        const std::optional<int32_t> number = diag_number(name);
        if (!number) {
            __android_log_print(ANDROID_LOG_WARN, tag, "Unexpected file in %s directory: %s",
                                paths::diag_dir, name.data());
            return;
        }
        found.highest = std::max(found.highest, *number);
        found.lowest = std::min(found.lowest, *number);
    });
    if (scanned) numbers = found;
    return scanned;
}

void delete_diag_file(const diag_path& path) { delete_entry(path.text); }

void delete_diag_files(int32_t from, int32_t to) {
    // Goes by the files that exist: numbers may be too far apart to try each of them.
    (void)for_each_entry(paths::diag_dir, [from, to](std::string_view name) {
        const std::optional<int32_t> number = diag_number(name);
        if (!number || *number < from || *number > to) return;
        delete_diag_file({'y', *number});
        delete_diag_file({'z', *number});
    });
}

void delete_all_diag_entries() {
    (void)for_each_entry(paths::diag_dir, [](std::string_view name) {
        char path[sizeof paths::diag_dir + NAME_MAX];
        snprintf(path, sizeof path, "%s%s", paths::diag_dir, name.data());
        delete_entry(path);
    });
}

unique_fd open_diag_file(int32_t number) {
    unique_fd compressed = open_regular(diag_path('y', number).text);
    return compressed.ok() ? std::move(compressed) : open_regular(diag_path('z', number).text);
}

int32_t next_diag_file(int32_t number) {
    (void)scan_diag_files(exported);
    const int64_t next = int64_t{number} + 1;
    if (exported.lowest > exported.highest || exported.highest < next) return -1;
    return static_cast<int32_t>(std::max(next, int64_t{exported.lowest}));
}

void diag_files_release() { exported = {}; }

}  // namespace kivd
