#include "util/unique_fd.h"

#include <unistd.h>

#include <cerrno>

namespace kivd {

void unique_fd::reset(int fd) noexcept {
    const int saved_errno = errno;
    if (fd_ >= 0) (void)close(fd_);  // after EINTR the number may already be someone else's
    fd_ = fd;
    errno = saved_errno;
}

}  // namespace kivd
