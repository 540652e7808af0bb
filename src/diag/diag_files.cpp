#include "diag/diag_files.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <optional>
#include <string_view>

#include "daemon/error/log_and_raise.h"
#include "platform/android_log.h"
#include "util/paths.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-qz";

// The last one that a client asked for: it still answers when the directory is gone.
constinit diag_numbers exported = {};

// Calls `function` with the name of each entry. False, with errno set, when the directory cannot be
// opened.
bool for_each_entry(auto function) {
    const unique_dir directory(opendir(paths::diag_dir));
    if (!directory) return false;
    while (const dirent* const entry = readdir(directory.get())) {
        const std::string_view name = entry->d_name;
        if (name != "." && name != "..") function(entry->d_name);
    }
    return true;
}

// Reads a name as scanf does with "q%*c_%d": what follows the number does not matter.
std::optional<int32_t> diag_number(const char* name) {
    if (name[0] != 'q' || name[1] == '\0' || name[2] != '_') return std::nullopt;
    char* end = nullptr;
    const long number = strtol(name + 3, &end, 10);
    if (end == name + 3) return std::nullopt;
    return static_cast<int32_t>(number);
}

// A file that is gone already is fine.
void delete_entry(const char* path) {
    if (unlink(path) == 0 || errno == ENOENT) return;
    (void)log_and_raise(tag, "Failed to delete %s, <%s>", path, strerror(errno));
}

}  // namespace

diag_path::diag_path(char letter, int32_t number) {
    snprintf(text, sizeof text, "%sq%c_%d", paths::diag_dir, letter, number);
}

bool scan_diag_files(diag_numbers& numbers) {
    diag_numbers found = {1, no_diag_file};
    const bool scanned = for_each_entry([&found](const char* name) {
        const std::optional<int32_t> number = diag_number(name);
        if (!number) {
            __android_log_print(ANDROID_LOG_WARN, tag, "Unexpected file in %s directory: %s",
                                paths::diag_dir, name);
            return;
        }
        found.highest = std::max(found.highest, *number);
        found.lowest = std::min(found.lowest, *number);
    });
    if (scanned) numbers = found;
    return scanned;
}

void delete_diag_files(int32_t from, int32_t to) {
    // By what is there: with numbers far apart there may be very many to go through.
    (void)for_each_entry([from, to](const char* name) {
        const std::optional<int32_t> number = diag_number(name);
        if (!number || *number < from || *number > to) return;
        delete_entry(diag_path('y', *number).text);
        delete_entry(diag_path('z', *number).text);
    });
}

void delete_all_diag_entries() {
    (void)for_each_entry([](const char* name) {
        char path[sizeof paths::diag_dir + NAME_MAX];
        snprintf(path, sizeof path, "%s%s", paths::diag_dir, name);
        delete_entry(path);
    });
}

void delete_plain_diag_file(int32_t number) { delete_entry(diag_path('z', number).text); }

unique_fd qz_file_open(int32_t number) {
    unique_fd compressed(open(diag_path('y', number).text, O_RDONLY | O_CLOEXEC));
    if (compressed.ok()) return compressed;
    return unique_fd(open(diag_path('z', number).text, O_RDONLY | O_CLOEXEC));
}

int32_t qz_file_next(int32_t number) {
    (void)scan_diag_files(exported);
    const int64_t next = int64_t{number} + 1;
    if (exported.lowest > exported.highest || exported.highest < next) return -1;
    return static_cast<int32_t>(std::max(next, int64_t{exported.lowest}));
}

}  // namespace kivd
