#include "kivctl/file_rights.h"

#include <sys/stat.h>

#include <climits>
#include <cstdlib>

namespace kivd {
namespace {

bool has_any_of(const std::string& path, mode_t mode) {
    struct stat status = {};
    return stat(path.c_str(), &status) == 0 && (status.st_mode & mode) != 0;
}

}  // namespace

bool is_open_to_all(const std::string& path, mode_t mode) {
    char real_path[PATH_MAX];
    if (realpath(path.c_str(), real_path) == nullptr || !has_any_of(real_path, mode)) return false;
    std::string directory = real_path;
    while (!directory.empty()) {
        directory.resize(directory.rfind('/'));
        if (!has_any_of(directory + "/", S_IXOTH)) return false;
    }
    return true;
}

}  // namespace kivd
