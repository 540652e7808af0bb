// Replacing a file in one step: readers see the old content or the whole new one.
#pragma once

#include "util/unique_fd.h"

namespace kivd {

// The new content of `path` while it is being written, under `temporary` in the same file system.
// Both names may lie where others write: whatever has one of them, a link or a pipe, goes and is
// neither followed nor waited for. Unless it gets into place, the temporary file is removed again.
class file_replacement {
 public:
    // The caller keeps the texts. It may be not ok, with errno set.
    file_replacement(const char* path, const char* temporary);
    ~file_replacement();
    file_replacement(const file_replacement&) = delete;
    file_replacement& operator=(const file_replacement&) = delete;

    [[nodiscard]] bool ok() const { return fd_.ok(); }  // until it is closed
    [[nodiscard]] int fd() const { return fd_.get(); }

    // The two steps at the end, each false, with errno set, when it fails. On a full device it may
    // be the close that does.
    [[nodiscard]] bool close();
    [[nodiscard]] bool put_into_place();

 private:
    const char* path_;
    const char* temporary_;
    unique_fd fd_;
    bool exists_ = false;
};

}  // namespace kivd
