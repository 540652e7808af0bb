#include "intake/log_reader.h"

#include <poll.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstring>
#include <utility>

#include "runtime/child_process.h"
#include "runtime/log_and_raise.h"
#include "runtime/stop.h"
#include "util/clock.h"
#include "util/paths.h"
#include "util/unique_fd.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-conf";

// A pidfd, since the id may belong to another process once the reader has ended. -1: none.
constinit int log_reader_fd = -1;

[[noreturn]] void become_log_reader() {
    const char* const usual[] = {paths::log_reader, "main", nullptr};
    const char* const test_mode[] = {paths::log_reader, "-s", "/data/kiv_run/", "main", nullptr};
    exec_program(is_test_mode() ? test_mode : usual);
    log_and_raise(tag, "Failed to execute log reader: %s", strerror(errno));
    _exit(1);
}

}  // namespace

void start_log_reader() {
    const pid_t pid = fork_child(child_kind::program);
    if (pid == 0) become_log_reader();
    if (pid < 0) {
        log_and_raise(tag, "Failed to start log reader");
        return;
    }
    log_reader_fd = static_cast<int>(syscall(SYS_pidfd_open, pid, 0));
    if (log_reader_fd >= 0 || errno == ESRCH) return;  // or it has ended already
    log_and_raise(tag, "Failed to keep hold of log reader: %s", strerror(errno));
}

void stop_log_reader() {
    const unique_fd reader(std::exchange(log_reader_fd, -1));
    if (!reader.ok() || syscall(SYS_pidfd_send_signal, reader.get(), SIGTERM, nullptr, 0) != 0) {
        return;
    }
    pollfd awaited[] = {{reader.get(), POLLIN, 0}, {stop_event_fd(), POLLIN, 0}};
    while (poll(awaited, 2, -1) < 0 && errno == EINTR) {
    }
}

void log_reader_release() {
    if (log_reader_fd >= 0) (void)close(std::exchange(log_reader_fd, -1));
}

}  // namespace kivd
