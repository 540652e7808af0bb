#include "util/file_replacement.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>

namespace kivd {

file_replacement::file_replacement(const char* path, const char* temporary)
    : path_(path), temporary_(temporary) {
    if (unlink(temporary) != 0 && errno != ENOENT) return;
    fd_.reset(open(temporary, O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0666));
    exists_ = fd_.ok();
}

file_replacement::~file_replacement() {
    const int saved_errno = errno;
    if (exists_) (void)unlink(temporary_);
    errno = saved_errno;
}

bool file_replacement::close() { return ::close(fd_.release()) == 0; }

bool file_replacement::put_into_place() {
    if (rename(temporary_, path_) != 0) return false;
    exists_ = false;
    return true;
}

}  // namespace kivd
