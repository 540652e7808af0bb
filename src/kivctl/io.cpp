#include "kivctl/io.h"

#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <utility>

#include "toolkit/whole_file.h"
#include "util/clock.h"
#include "util/file_io.h"
#include "util/unique_fd.h"

namespace kivd {
namespace {

[[noreturn]] void fail(const std::string& what) { throw failure(what + ": " + strerror(errno)); }

// False, with errno set, when `file` cannot take it.
bool copy_content(int fd, FILE* file) {
    char bytes[16'384];
    ssize_t size;
    while ((size = read(fd, bytes, sizeof bytes)) != 0) {
        if (size < 0 && errno == EINTR) continue;
        if (size < 0) fail("cannot read what the daemon handed over");
        const auto count = static_cast<size_t>(size);
        if (fwrite(bytes, 1, count, file) != count) return false;
    }
    return fflush(file) == 0;
}

}  // namespace

std::string name_source(const std::string& path) { return path == "-" ? "standard input" : path; }

std::string read_source(const std::string& path, size_t size_max, const char* kind) {
    const bool is_input = path == "-";
    const unique_file opened(is_input ? nullptr : fopen(path.c_str(), "re"));
    FILE* file = is_input ? stdin : opened.get();
    const std::string source = name_source(path);
    if (file == nullptr) fail("cannot open " + source);
    std::optional<std::string> content = read_up_to(file, size_max);
    if (!content) fail("cannot read " + source);
    if (content->size() > size_max) {
        throw failure(source + " is too large for " + kind + ", which has at most " +
                      std::to_string(size_max) + " bytes");
    }
    return std::move(*content);
}

std::optional<std::string> read_if_possible(const std::string& path, size_t size_max) {
    const unique_file file = open_to_read(path.c_str());
    if (!file) return std::nullopt;
    std::optional<std::string> content = read_up_to(file.get(), size_max);
    return content && content->size() <= size_max ? content : std::nullopt;
}

deadline::deadline(unsigned milliseconds) : end_ms_(monotonic_ms() + milliseconds) {}

unsigned deadline::left_ms() const {
    return static_cast<unsigned>(std::max<int64_t>(end_ms_ - monotonic_ms(), 0));
}

void print_line(const char* text) {
    if (puts(text) < 0 || fflush(stdout) != 0) fail_output();
}

void print_content(int fd) {
    if (!copy_content(fd, stdout)) fail_output();
}

void save_content(int fd, const std::string& path) {
    unique_file file(fopen(path.c_str(), "we"));
    if (!file) fail("cannot create " + path);
    if (!copy_content(fd, file.get()) || fclose(file.release()) != 0) fail("cannot write " + path);
}

void fail_output() { fail("cannot write to standard output"); }

}  // namespace kivd
