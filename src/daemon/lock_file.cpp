#include "daemon/lock_file.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>

#include "runtime/child_process.h"
#include "runtime/give_up.h"
#include "util/file_io.h"
#include "util/paths.h"
#include "util/unique_fd.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd";

unique_fd open_locked() {
    unique_fd fd(open(paths::lock_file, O_RDWR | O_CREAT | O_CLOEXEC, 0644));
    if (!fd.ok()) {
        give_up(tag, "Failed to open lock file %s, and errno is %s", paths::lock_file,
                strerror(errno));
    }
    if (flock(fd.get(), LOCK_EX | LOCK_NB) != 0) {
        give_up(tag, "Another kivd is already running, and errno is %s", strerror(errno));
    }
    return fd;
}

// Whether the file still has that name: a daemon that is just ending removes its own.
bool is_current_lock(int fd) {
    struct stat locked = {};
    struct stat named = {};
    return fstat(fd, &locked) == 0 && stat(paths::lock_file, &named) == 0 &&
           locked.st_ino == named.st_ino && locked.st_dev == named.st_dev;
}

}  // namespace

void take_lock() {
    unique_fd fd = open_locked();
    while (!is_current_lock(fd.get())) fd = open_locked();
    char line[20];
    const int size = snprintf(line, sizeof line, "%d\n", getpid());
    if (!write_all(fd.get(), line, static_cast<size_t>(size))) {
        give_up(tag, "Failed to write lock file %s, and errno is %s", paths::lock_file,
                strerror(errno));
    }
    set_inherited_descriptor(fd.release());
}

}  // namespace kivd
