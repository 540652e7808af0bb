#include "runtime/child_process.h"

#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <thread>

#include "runtime/daemon_error.h"
#include "runtime/log_and_raise.h"
#include "support/scratch_directory.h"

namespace kivd {
namespace {

class child_process : public scratch_directory {};

TEST_F(child_process, raises_errors_whatever_other_threads_do_and_holds_the_lock_only) {
    const unique_fd lock(open("lock", O_RDWR | O_CREAT | O_CLOEXEC, 0600));
    const unique_fd other(open("other", O_RDWR | O_CREAT | O_CLOEXEC, 0600));
    set_inherited_descriptor(lock.get());
    std::atomic<bool> done = false;
    std::thread thread([&done] {
        for (; !done; (void)take_log()) {
            set_error_nr(0);  // the flood guard would let only the first ones be sent
            (void)log_and_raise("test", "from the thread");
        }
    });
    for (int i = 0; i < 300 && !HasFailure(); ++i) {
        const pid_t child = fork_child(child_kind::worker);
        if (child == 0) {
            alarm(20);  // not for ever
            (void)log_and_raise("test", "from the child");
            _exit(fcntl(lock.get(), F_GETFD) >= 0 && fcntl(other.get(), F_GETFD) < 0 ? 7 : 1);
        }
        (void)next_packet();
        int status = 0;
        EXPECT_EQ(waitpid(child, &status, 0), child);
        EXPECT_EQ(WEXITSTATUS(status), 7) << status;
    }
    done = true;
    thread.join();
}

}  // namespace
}  // namespace kivd
