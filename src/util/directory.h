// Walking through a directory.
#pragma once

#include <cerrno>
#include <string_view>

#include "util/unique_fd.h"

namespace kivd {

// Calls `function` with the name of each entry but "." and "..", which has a NUL behind it. False,
// with errno set, when the directory cannot be read, or not to its end.
bool for_each_entry(const char* path, auto function) {
    const unique_dir directory(opendir(path));
    if (!directory) return false;
    for (;;) {
        errno = 0;
        const dirent* const entry = readdir(directory.get());
        if (entry == nullptr) return errno == 0;
        const std::string_view name = entry->d_name;
        if (name != "." && name != "..") function(name);
    }
}

}  // namespace kivd
