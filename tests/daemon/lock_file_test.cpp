#include "daemon/lock_file.h"

#include <sys/syscall.h>
#include <unistd.h>

#include "support/scratch_directory.h"

// In place of the system's: the daemon before is just going, and removes the file in between.
extern "C" int flock(int fd, int operation) noexcept {
    static bool is_removed = false;
    if (!is_removed) unlink("kivd.pid");
    is_removed = true;
    return static_cast<int>(syscall(SYS_flock, fd, operation));
}

namespace kivd {
namespace {

class lock_file : public scratch_directory {};

TEST_F(lock_file, is_the_one_that_has_the_name) {
    take_lock();
    EXPECT_EQ(read_file("kivd.pid"), std::to_string(getpid()) + "\n");
}

}  // namespace
}  // namespace kivd
