#include "kivtool/report/report_paths.h"

#include <sys/stat.h>

#include <algorithm>
#include <charconv>
#include <cstring>

#include "format/report_name.h"
#include "util/directory.h"
#include "util/paths.h"

namespace kivd {
namespace {

// 0 when it is no report's name: those have no sign and no zeros before the number.
int64_t report_number_of(std::string_view name) {
    if (!name.starts_with(report_prefix)) return 0;
    name.remove_prefix(strlen(report_prefix));
    if (name.starts_with('-') || name.starts_with('0')) return 0;
    int64_t number = 0;
    const auto [end, error] = std::from_chars(name.data(), name.data() + name.size(), number);
    return error == std::errc() && end == name.data() + name.size() ? number : 0;
}

}  // namespace

report_paths::report_paths(const std::string& path) : path_(path) {
    struct stat status {};
    is_directory_ = stat(path.c_str(), &status) == 0 && S_ISDIR(status.st_mode);
    if (!is_directory_) return;
    if (!path_.ends_with('/')) path_ += '/';
    const bool is_whole = for_each_entry(path_.c_str(), [this](std::string_view name) {
        if (const int64_t number = report_number_of(name)) numbers_.push_back(number);
    });
    if (!is_whole) {
        problem_ = std::string("cannot be read: ") + strerror(errno);
    } else if (numbers_.empty()) {
        problem_ = "is a directory without reports";
    }
    std::ranges::sort(numbers_);
}

std::string report_paths::path(size_t index) const {
    if (!is_directory_) return path_;
    return path_ + report_prefix + std::to_string(numbers_[index]);
}

}  // namespace kivd
