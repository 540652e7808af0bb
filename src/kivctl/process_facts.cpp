#include "kivctl/process_facts.h"

#include <getopt.h>
#include <grp.h>
#include <pwd.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>

#include <algorithm>
#include <cerrno>
#include <cinttypes>
#include <csignal>
#include <cstdio>
#include <sstream>
#include <string_view>

#include "daemon/option_names.h"
#include "kivctl/io.h"
#include "util/paths.h"

namespace kivd {
namespace {

constexpr size_t proc_file_size_max = 4'000'000;

std::optional<std::string> read_proc(pid_t pid, const std::string& name) {
    return read_if_possible("/proc/" + std::to_string(pid) + "/" + name, proc_file_size_max);
}

std::optional<pid_t> read_pid() {
    const auto text = read_if_possible(paths::lock_file, 100);
    int pid = 0;
    if (!text || sscanf(text->c_str(), "%9d\n", &pid) != 1 || pid <= 0) return std::nullopt;
    return pid;
}

struct lock {
    std::optional<bool> is_held;
    std::optional<pid_t> pid;  // of whoever took it
};

// Trying the lock could keep a daemon that is just starting from taking it; reading /proc/locks
// cannot. On some file systems the device there differs from that of stat().
lock find_lock(const struct stat& file, std::optional<pid_t> written_pid) {
    const auto locks = read_if_possible("/proc/locks", proc_file_size_max);
    if (!locks) return {std::nullopt, written_pid};
    std::istringstream lines(*locks);
    for (std::string line; std::getline(lines, line);) {
        int pid = 0;
        unsigned device_major = 0, device_minor = 0;
        uint64_t inode = 0;
        if (sscanf(line.c_str(), "%*s FLOCK %*s WRITE %d %x:%x:%" SCNu64, &pid, &device_major,
                   &device_minor, &inode) != 4 ||
            inode != file.st_ino) {
            continue;
        }
        const bool is_same_device =
            device_major == major(file.st_dev) && device_minor == minor(file.st_dev);
        if (is_same_device || pid == written_pid) {
            return {true, pid > 0 ? std::optional(pid) : written_pid};
        }
    }
    return {false, std::nullopt};
}

bool exists(pid_t pid) { return kill(pid, 0) == 0 || errno != ESRCH; }

daemon_arguments parse_arguments(std::string text) {
    std::vector<char*> arguments;
    for (size_t at = 0; at < text.size(); at = text.find('\0', at) + 1) {
        arguments.push_back(text.data() + at);
    }
    const int count = static_cast<int>(arguments.size());
    arguments.push_back(nullptr);
    daemon_arguments found;
    optind = 0;
    opterr = 0;
    int letter = 0;
    // NOLINTNEXTLINE(concurrency-mt-unsafe): kivctl has one thread
    while ((letter = getopt_long(count, arguments.data(), short_options.data(), long_options,
                                 nullptr)) != -1) {
        if (letter == 'c') found.key_directory = optarg;
        if (letter == 't') found.is_test_mode = true;
    }
    return found;
}

std::optional<bool> find_stopped(pid_t pid) {
    const auto text = read_proc(pid, "stat");
    if (!text) return std::nullopt;
    const size_t name_end = text->rfind(')');  // a name may hold anything
    if (name_end == std::string::npos || name_end + 2 >= text->size()) return std::nullopt;
    const char state = (*text)[name_end + 2];
    return state == 'T' || state == 't';
}

// The numbers behind `key` in /proc/PID/status.
std::vector<unsigned> status_numbers(const std::string& status, const std::string& key) {
    const size_t at = status.find("\n" + key + ":");
    if (at == std::string::npos) return {};
    std::istringstream line(
        status.substr(at + key.size() + 2, status.find('\n', at + 1) - at - key.size() - 2));
    std::vector<unsigned> numbers;
    for (unsigned number = 0; line >> number;) numbers.push_back(number);
    return numbers;
}

std::optional<user_ids> find_ids(pid_t pid) {
    const auto status = read_proc(pid, "status");
    if (!status) return std::nullopt;
    const auto uids = status_numbers(*status, "Uid");
    const auto gids = status_numbers(*status, "Gid");
    if (uids.size() < 2 || gids.size() < 2) return std::nullopt;
    const auto groups = status_numbers(*status, "Groups");
    return user_ids{uids[1], gids[1], {groups.begin(), groups.end()}};  // the effective ones
}

}  // namespace

process_facts find_daemon_process() {
    process_facts found;
    struct stat file = {};
    if (stat(paths::lock_file, &file) != 0) {
        if (errno == ENOENT) found.is_lock_held = found.is_running = false;
        return found;
    }
    const auto [is_held, pid] = find_lock(file, read_pid());
    found.is_lock_held = is_held;
    if (is_held == false || (pid && !exists(*pid))) {
        found.is_running = false;  // a child that has outlived the daemon may still hold the lock
    } else if (is_held && pid) {
        found.is_running = true;
    }
    if (found.is_running != true) return found;
    found.pid = pid;
    found.is_stopped = find_stopped(*pid);
    const auto arguments = read_proc(*pid, "cmdline");
    if (arguments && !arguments->empty()) found.arguments = parse_arguments(*arguments);
    found.user = find_ids(*pid);
    return found;
}

std::optional<bool> has_worker(const process_facts& daemon) {
    if (!daemon.is_running) return std::nullopt;
    if (!daemon.pid) return daemon.is_lock_held;
    const auto text = read_proc(*daemon.pid, "task/" + std::to_string(*daemon.pid) + "/children");
    const auto arguments = read_proc(*daemon.pid, "cmdline");
    if (!text || !arguments) return std::nullopt;
    std::istringstream children(*text);
    for (pid_t child = 0; children >> child;) {  // a log reader runs another program
        if (read_proc(child, "cmdline") == arguments) return true;
    }
    return false;
}

std::optional<user_ids> find_user(const std::string& name) {
    const passwd* user = getpwnam(name.c_str());  // NOLINT(concurrency-mt-unsafe)
    if (user == nullptr) return std::nullopt;
    user_ids found = {user->pw_uid, user->pw_gid, std::vector<gid_t>(65536)};
    int count = static_cast<int>(found.groups.size());
    if (getgrouplist(name.c_str(), user->pw_gid, found.groups.data(), &count) < 0) {
        return std::nullopt;
    }
    found.groups.resize(static_cast<size_t>(count));
    return found;
}

}  // namespace kivd
