#include "toolkit/whole_file.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <stdexcept>
#include <utility>

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

std::optional<std::string> read_up_to(FILE* file, size_t max_size) {
    std::string bytes;
    std::array<char, 65536> piece;
    while (bytes.size() <= max_size) {
        const size_t wanted = std::min(piece.size(), max_size + 1 - bytes.size());
        const size_t size = fread(piece.data(), 1, wanted, file);
        bytes.append(piece.data(), size);
        if (size < wanted) break;
    }
    return ferror(file) == 0 ? std::optional(std::move(bytes)) : std::nullopt;
}

std::string read_whole_file(const std::string& path, size_t max_size) {
    const unique_file file(fopen(path.c_str(), "re"));
    if (!file) fail_with_reason(path, "cannot be opened");
    std::optional<std::string> bytes = read_up_to(file.get(), max_size);
    if (!bytes) fail_with_reason(path, "cannot be read");
    if (bytes->size() > max_size)
        fail(path, "has more than " + std::to_string(max_size) + " bytes");
    return std::move(*bytes);
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
