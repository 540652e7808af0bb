// The process that serves a working directory, as anybody can see it from its lock file and /proc.
// Who holds the lock is read from /proc/locks: to try the lock could keep a daemon that is just
// starting from having it.
#pragma once

#include <sys/types.h>

#include <optional>
#include <string>
#include <vector>

namespace kivd {

struct user_ids {
    uid_t uid;
    gid_t gid;
    std::vector<gid_t> groups;
};

// What the command line of the daemon says.
struct daemon_arguments {
    std::optional<std::string> key_directory;  // that of -c, as given
    bool is_test_mode = false;
};

// A missing value could not be found out.
struct process_facts {
    std::optional<bool> is_lock_held;
    std::optional<bool> is_running;  // even if it is stopped
    std::optional<pid_t> pid;        // of the running one
    std::optional<bool> is_stopped;  // by a signal or a debugger
    std::optional<daemon_arguments> arguments;
    std::optional<user_ids> user;
};

// Looks for the daemon of the current directory.
[[nodiscard]] process_facts find_daemon_process();

// Whether a child of the daemon, perhaps one that has outlived it, is making a report or
// compressing a file.
[[nodiscard]] std::optional<bool> has_worker(const process_facts& daemon);

[[nodiscard]] std::optional<user_ids> find_user(const std::string& name);

}  // namespace kivd
