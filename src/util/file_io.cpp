#include "util/file_io.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>

namespace kivd {

bool write_all(int fd, const void* bytes, size_t size) {
    iovec piece = {const_cast<void*>(bytes), size};
    return write_all(fd, {&piece, 1});
}

bool write_all(int fd, std::span<iovec> pieces) {
    size_t left = 0;
    for (const iovec& piece : pieces) left += piece.iov_len;
    while (left > 0) {
        const ssize_t n = writev(fd, pieces.data(), static_cast<int>(pieces.size()));
        if (n < 0 && errno == EINTR) continue;
        if (n == 0) errno = ENOSPC;
        if (n <= 0) return false;
        left -= static_cast<size_t>(n);
        auto written = static_cast<size_t>(n);
        while (!pieces.empty() && written >= pieces.front().iov_len) {
            written -= pieces.front().iov_len;
            pieces = pieces.subspan(1);
        }
        if (written > 0) {
            pieces.front().iov_base = static_cast<char*>(pieces.front().iov_base) + written;
            pieces.front().iov_len -= written;
        }
    }
    return true;
}

bool copy_all(int source, int destination) {
    std::array<char, 16384> chunk;
    for (;;) {
        const ssize_t size = read(source, chunk.data(), chunk.size());
        if (size < 0 && errno == EINTR) continue;
        if (size <= 0) return size == 0;
        if (!write_all(destination, chunk.data(), static_cast<size_t>(size))) return false;
    }
}

std::optional<uint64_t> get_file_size(FILE* file) {
    if (fseeko(file, 0, SEEK_END) != 0) return std::nullopt;
    const off_t size = ftello(file);
    if (size < 0 || fseeko(file, 0, SEEK_SET) != 0) return std::nullopt;
    return static_cast<uint64_t>(size);
}

std::optional<file_bytes> read_whole_fd(unique_fd fd) {
    struct stat status = {};
    if (fstat(fd.get(), &status) != 0) return std::nullopt;
    const auto size = static_cast<size_t>(status.st_size);
    unique_malloc<uint8_t> data(static_cast<uint8_t*>(malloc(size + 1)));
    if (!data) return std::nullopt;
    size_t done = 0;
    while (done < size) {
        const ssize_t n = pread(fd.get(), data.get() + done, size - done, static_cast<off_t>(done));
        if (n < 0 && errno == EINTR) continue;
        if (n == 0) errno = EIO;  // it has become shorter meanwhile
        if (n <= 0) return std::nullopt;
        done += static_cast<size_t>(n);
    }
    return file_bytes{std::move(data), size};
}

unique_fd create_file(const char* path) {
    return unique_fd(open(path, O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0666));
}

unique_fd open_regular(const char* path) {
    unique_fd fd(open(path, O_RDONLY | O_CLOEXEC | O_NONBLOCK));  // a pipe may have no writer
    struct stat status = {};
    if (fd.ok() && (fstat(fd.get(), &status) != 0 || !S_ISREG(status.st_mode))) {
        fd.reset();
        errno = EINVAL;
    }
    return fd;
}

unique_fd open_readable(const char* path) {
    unique_fd fd(open(path, O_RDONLY | O_CLOEXEC | O_NONBLOCK));
    struct stat status = {};
    if (fd.ok() && fstat(fd.get(), &status) == 0 && S_ISDIR(status.st_mode)) {
        fd.reset();
        errno = EISDIR;
    }
    return fd;
}

unique_file open_to_read(const char* path) {
    unique_fd fd = open_readable(path);
    unique_file file(fd.ok() ? fdopen(fd.get(), "r") : nullptr);
    if (file) (void)fd.release();
    return file;
}

}  // namespace kivd
