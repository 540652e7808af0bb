#include "toolkit/whole_file.h"

#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdio>
#include <cstring>

#include "util/unique_fd.h"

namespace kivd {
namespace {

std::string with_reason(const char* what) { return std::string(what) + ": " + strerror(errno); }

bool write_new_file(const std::string& path, std::string_view bytes) {
    unique_file file(fopen(path.c_str(), "wxe"));
    if (!file) return false;
    if (fwrite(bytes.data(), 1, bytes.size(), file.get()) < bytes.size()) return false;
    return fclose(file.release()) == 0;
}

}  // namespace

std::string read_whole_file(const std::string& path, size_t max_size, std::string& bytes) {
    const unique_file file(fopen(path.c_str(), "re"));
    if (!file) return with_reason("cannot be opened");
    bytes.clear();
    std::array<char, 65536> piece;
    while (const size_t size = fread(piece.data(), 1, piece.size(), file.get())) {
        bytes.append(piece.data(), size);
        if (bytes.size() > max_size) return "has more than " + std::to_string(max_size) + " bytes";
    }
    return ferror(file.get()) ? with_reason("cannot be read") : "";
}

std::string replace_file(const std::string& path, std::string_view bytes) {
    struct stat status {};
    if (stat(path.c_str(), &status) == 0 && !S_ISREG(status.st_mode)) {
        return "exists and is no regular file";
    }
    const std::string new_path = path + "." + std::to_string(getpid()) + ".tmp";
    std::string problem;
    if (!write_new_file(new_path, bytes)) {
        problem = with_reason("cannot be written");
    } else if (rename(new_path.c_str(), path.c_str()) != 0) {
        problem = with_reason("cannot be put into place");
    }
    if (!problem.empty()) (void)remove(new_path.c_str());
    return problem;
}

}  // namespace kivd
