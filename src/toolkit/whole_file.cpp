#include "toolkit/whole_file.h"

#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <stdexcept>

#include "toolkit/text_escape.h"
#include "util/unique_fd.h"

namespace kivd {
namespace {

[[noreturn]] void fail(const std::string& path, const std::string& what) {
    throw std::runtime_error(printable(path) + ": " + what);
}

[[noreturn]] void fail_with_reason(const std::string& path, const std::string& what) {
    fail(path, what + ": " + strerror(errno));
}

bool write_new_file(const std::string& path, std::string_view bytes) {
    unique_file file(fopen(path.c_str(), "wxe"));
    if (!file) return false;
    if (fwrite(bytes.data(), 1, bytes.size(), file.get()) < bytes.size()) return false;
    return fclose(file.release()) == 0;
}

}  // namespace

std::string read_whole_file(const std::string& path, size_t max_size) {
    const unique_file file(fopen(path.c_str(), "re"));
    if (!file) fail_with_reason(path, "cannot be opened");
    std::string bytes;
    std::array<char, 65536> piece;
    while (const size_t size = fread(piece.data(), 1, piece.size(), file.get())) {
        bytes.append(piece.data(), size);
        if (bytes.size() > max_size) {
            fail(path, "has more than " + std::to_string(max_size) + " bytes");
        }
    }
    if (ferror(file.get())) fail_with_reason(path, "cannot be read");
    return bytes;
}

void replace_file(const std::string& path, std::string_view bytes) {
    struct stat status {};
    if (stat(path.c_str(), &status) == 0 && !S_ISREG(status.st_mode)) {
        fail(path, "exists and is no regular file");
    }
    const std::string new_path = path + "." + std::to_string(getpid()) + ".tmp";
    const bool is_written = write_new_file(new_path, bytes);
    if (is_written && rename(new_path.c_str(), path.c_str()) == 0) return;
    const int reason = errno;
    (void)remove(new_path.c_str());
    errno = reason;
    fail_with_reason(path, is_written ? "cannot be put into place" : "cannot be written");
}

}  // namespace kivd
