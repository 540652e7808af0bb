// Whole writes and reads, and sizes of files.
#pragma once

#include <sys/uio.h>

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <optional>
#include <span>

#include "util/releaser.h"
#include "util/unique_fd.h"

namespace kivd {

// Writes all `size` bytes, through short writes and EINTR. False, with errno set, when that fails:
// some of them may then have been written. A write that takes nothing counts as a full device
// (ENOSPC).
[[nodiscard]] bool write_all(int fd, const void* bytes, size_t size);

// The same for several pieces in one call each round; `pieces` is used up on the way.
[[nodiscard]] bool write_all(int fd, std::span<iovec> pieces);

// Size in bytes of an open file, if it can be had. The stream is then at its start.
[[nodiscard]] std::optional<uint64_t> get_file_size(FILE* file);

// What a file held, in a block of malloc of at least one byte.
struct file_bytes {
    unique_malloc<uint8_t> data;
    size_t size;

    [[nodiscard]] std::span<const uint8_t> view() const { return {data.get(), size}; }
};

// Reads a file from its start to its end and closes it. Nothing, with errno set, when it cannot be
// read, is shorter than it said, or there is no memory for it.
[[nodiscard]] std::optional<file_bytes> read_whole_fd(unique_fd fd);

// Writes all that is left of what `source` reads. False, with errno set, when either fails.
[[nodiscard]] bool copy_all(int source, int destination);

// Creates a file to write to, or empties the one that is there; not ok, with errno set, on failure.
[[nodiscard]] unique_fd create_file(const char* path);

// Opens a regular file to read; not ok, with errno set, when it is none (EINVAL) or cannot be
// opened.
[[nodiscard]] unique_fd open_regular(const char* path);

// Opens a file to read; not ok, or null, with errno set. Unlike a plain open it refuses a directory
// (EISDIR) and doesn't wait for the writer of a pipe.
[[nodiscard]] unique_fd open_readable(const char* path);
[[nodiscard]] unique_file open_to_read(const char* path);

}  // namespace kivd
