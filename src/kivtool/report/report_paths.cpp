#include "kivtool/report/report_paths.h"

#include <sys/stat.h>

#include <algorithm>
#include <cstring>

#include "format/report_name.h"
#include "util/directory.h"

namespace kivd {
report_paths::report_paths(const std::string& path) : path_(path) {
    struct stat status {};
    is_directory_ = stat(path.c_str(), &status) == 0 && S_ISDIR(status.st_mode);
    if (!is_directory_) return;
    if (!path_.ends_with('/')) path_ += '/';
    const bool is_whole = for_each_entry(path_.c_str(), [this](std::string_view name) {
        if (const auto number = parse_report_name(name.data())) numbers_.push_back(*number);
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
    return path_ + report_name(numbers_[index]).text;
}

}  // namespace kivd
