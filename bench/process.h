// Child processes and what the kernel says about them.
#pragma once

#include <sched.h>
#include <sys/types.h>

#include <cstdint>
#include <functional>
#include <span>
#include <string>
#include <vector>

#include "bench/daemon_process.h"
#include "util/unique_fd.h"

namespace kivd::bench {

// SIGTERM, then waits until the process is gone; gives the run up when it isn't in time. The time
// from the signal to the end, in ns.
int64_t stop(child_process& process);
// Waits until it has ended by itself; gives the run up when that takes over a minute or ends badly.
void join(child_process& process);

// Runs `body` in a child that dies with this process, and ends it when `body` returns.
[[nodiscard]] child_process fork_child(const std::function<void()>& body);

// In a child that is to become another program: what that prints is lost.
void send_output_nowhere();

// Runs `body` in such a child, which fills in the figures, and waits for its end. What the child
// does to the state of the process, a directory or a library, is gone with it.
void run_in_child(std::span<double> figures, const std::function<void(std::span<double>)>& body);

// Runs a program, found as the shell would, to its end and gives the time from its start to there,
// in ns. What it prints is lost; gives the run up when it fails.
int64_t run_program(const std::vector<std::string>& words);

// A directory of its own below `parent`, removed with all that is in it.
class scratch_directory {
 public:
    explicit scratch_directory(const std::string& parent);
    scratch_directory(const scratch_directory&) = delete;
    scratch_directory& operator=(const scratch_directory&) = delete;
    ~scratch_directory();
    [[nodiscard]] const std::string& path() const noexcept { return path_; }

 private:
    std::string path_;
};

// Keeps the first thread of a process (0: this thread) and what it starts from now on on one
// processor while in scope. With a single processor there is no choice and nothing happens.
class pinned_thread {
 public:
    pinned_thread(pid_t pid, int processor);
    pinned_thread(const pinned_thread&) = delete;
    pinned_thread& operator=(const pinned_thread&) = delete;
    ~pinned_thread();

 private:
    pid_t pid_;
    cpu_set_t before_;
};

// CPU time of all threads, user and system, in ns, with the scheduler's own precision; without the
// time of child processes.
[[nodiscard]] int64_t process_cpu_ns(pid_t pid);
// The same for the first thread alone.
[[nodiscard]] int64_t main_thread_cpu_ns(pid_t pid);
// How often the threads have gone to sleep of their own accord.
[[nodiscard]] int64_t voluntary_switches(pid_t pid);
// Memory that no other process shares and no file backs.
[[nodiscard]] int64_t private_dirty_bytes(pid_t pid);
// All that is in memory, shared libraries included.
[[nodiscard]] int64_t resident_bytes(pid_t pid);

// Kernel counters, read with read_counter. None where the kernel or its settings don't allow them.
//
// System calls of the thread `thread`, children and other threads not included.
[[nodiscard]] unique_fd open_system_call_counter(pid_t thread);
// CPU time in ns of the first thread of `pid` from now on, also with the children that it starts;
// each is added when it ends. The scheduler's figure above has time in it that this one hasn't, so
// only differences between the two counters are comparable with it.
enum class children : bool { left_out, included };
[[nodiscard]] unique_fd open_cpu_counter(pid_t pid, children with);
[[nodiscard]] int64_t read_counter(int fd);

}  // namespace kivd::bench
