// Whole writes and sizes of files.
#pragma once

#include <sys/uio.h>

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <span>

#include "util/unique_fd.h"

namespace kivd {

// Writes all `size` bytes, through short writes and EINTR. Gives `size`, or -1 with errno set; a
// write that takes nothing counts as a full device (ENOSPC).
[[nodiscard]] ssize_t write_all(int fd, const void* bytes, size_t size);

// The same for several pieces in one call each round; `pieces` is used up on the way.
[[nodiscard]] ssize_t write_all(int fd, std::span<iovec> pieces);

// Size in bytes of an open file, -1 when it cannot be had. The stream is then at its start.
[[nodiscard]] int64_t get_file_size(FILE* file);

// Opens a file to read; null with errno set. Unlike plain fopen it refuses a directory (EISDIR).
[[nodiscard]] unique_file open_to_read(const char* path);

}  // namespace kivd
