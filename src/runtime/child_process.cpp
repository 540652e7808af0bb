#include "runtime/child_process.h"

#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>

#include "platform/android_log.h"
#include "runtime/client_lines.h"
#include "runtime/daemon_error.h"
#include "runtime/stop.h"

namespace kivd {
namespace {

constinit int inherited_fd = -1;
constinit rlimit usual_descriptor_limit = {};

void drop_descriptors() {
    const auto first = static_cast<unsigned>(STDERR_FILENO + 1);
    if (inherited_fd < STDERR_FILENO + 1) {
        (void)close_range(first, ~0U, 0);
    } else {
        const auto kept = static_cast<unsigned>(inherited_fd);
        if (kept > first) (void)close_range(first, kept - 1, 0);
        (void)close_range(kept + 1, ~0U, 0);
    }
    daemon_error_forget_connection();
    log_forget_descriptor();
    stop_forget_event();
    line_cause_forget();
}

}  // namespace

void set_inherited_descriptor(int fd) { inherited_fd = fd; }

void raise_descriptor_limit() {
    if (getrlimit(RLIMIT_NOFILE, &usual_descriptor_limit) != 0) return;
    const rlimit raised = {usual_descriptor_limit.rlim_max, usual_descriptor_limit.rlim_max};
    (void)setrlimit(RLIMIT_NOFILE, &raised);
}

pid_t fork_child(child_kind kind) {
    // No handler may run in the child while it still shares the parent's wake-up event.
    sigset_t all;
    sigset_t before;
    sigfillset(&all);
    pthread_sigmask(SIG_SETMASK, &all, &before);
    daemon_error_lock();
    log_lock();

    const pid_t pid = fork();
    const int fork_errno = errno;
    if (pid == 0) drop_descriptors();

    log_unlock();
    daemon_error_unlock();
    // A child that becomes another program would lose a signal that its handler took now.
    if (pid != 0 || kind == child_kind::worker) pthread_sigmask(SIG_SETMASK, &before, nullptr);
    errno = fork_errno;
    return pid;
}

void exec_program(const char* const* arguments) {
    struct sigaction usual = {};
    usual.sa_handler = SIG_DFL;
    for (int signal = 1; signal < NSIG; ++signal) (void)sigaction(signal, &usual, nullptr);
    sigset_t none;
    sigemptyset(&none);
    pthread_sigmask(SIG_SETMASK, &none, nullptr);
    if (usual_descriptor_limit.rlim_max > 0) {
        (void)setrlimit(RLIMIT_NOFILE, &usual_descriptor_limit);
    }
    char* const no_environment[] = {nullptr};
    (void)execve(*arguments, const_cast<char* const*>(arguments), no_environment);
}

void wait_for_child(pid_t& pid) {
    while (pid >= 0 && waitpid(pid, nullptr, 0) < 0 && errno == EINTR) {
    }
    pid = -1;
}

}  // namespace kivd
