#include "reliability/torture/injection.h"

#include <fcntl.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <sys/ioctl.h>
#include <sys/prctl.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <csignal>
#include <cstddef>
#include <filesystem>
#include <fstream>
#include <map>
#include <regex>
#include <thread>

namespace kivd {
namespace {

// Which file a call is about: the descriptor or the path in one of its arguments.
struct watched_call {
    int number;
    const char* name;
    bool has_path;
    int argument;
};
// clang-format off
constexpr watched_call watched[] = {
#ifdef SYS_open  // which younger machines don't have
    {SYS_open, "open", true, 0}, {SYS_creat, "open", true, 0}, {SYS_rename, "rename", true, 0},
    {SYS_unlink, "unlink", true, 0}, {SYS_mkdir, "mkdir", true, 0}, {SYS_rmdir, "rmdir", true, 0},
    {SYS_link, "link", true, 0}, {SYS_chmod, "chmod", true, 0}, {SYS_access, "access", true, 0},
#endif
    {SYS_openat, "open", true, 1}, {SYS_renameat, "rename", true, 1},
    {SYS_renameat2, "rename", true, 1}, {SYS_unlinkat, "unlink", true, 1},
    {SYS_mkdirat, "mkdir", true, 1}, {SYS_linkat, "link", true, 1},
    {SYS_truncate, "truncate", true, 0}, {SYS_fchmodat, "chmod", true, 1},
    {SYS_statfs, "statfs", true, 0}, {SYS_write, "write", false, 0},
    {SYS_writev, "writev", false, 0}, {SYS_pwrite64, "write", false, 0},
    {SYS_pwritev, "writev", false, 0}, {SYS_ftruncate, "truncate", false, 0},
    {SYS_fallocate, "write", false, 0}, {SYS_sendfile, "write", false, 0},
    {SYS_copy_file_range, "write", false, 2}, {SYS_fchmod, "chmod", false, 0},
    {SYS_close, "close", false, 0}, {SYS_read, "read", false, 0}, {SYS_pread64, "read", false, 0},
    {SYS_readv, "read", false, 0}, {SYS_clone, "clone", false, 0},
};
// clang-format on

fault injected;
std::string directory;  // files elsewhere are left alone
pid_t first_process = 0;
std::map<std::string, int> made;
std::vector<std::string> calls;
std::atomic<bool> was_hit = false;
std::atomic<bool> has_ended = false;

// The listener's descriptor, -1 when that is not permitted.
int filter_this_thread() {
    std::vector<sock_filter> program = {
        BPF_STMT(BPF_LD | BPF_W | BPF_ABS, offsetof(seccomp_data, nr))};
    for (const watched_call& each : watched) {
        program.push_back(BPF_JUMP(BPF_JMP | BPF_JEQ, static_cast<uint32_t>(each.number), 0, 1));
        program.push_back(BPF_STMT(BPF_RET, SECCOMP_RET_USER_NOTIF));
    }
    program.push_back(BPF_STMT(BPF_RET, SECCOMP_RET_ALLOW));
    const sock_fprog filter = {static_cast<unsigned short>(program.size()), program.data()};
    (void)prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0);
    return static_cast<int>(
        syscall(SYS_seccomp, SECCOMP_SET_MODE_FILTER, SECCOMP_FILTER_FLAG_NEW_LISTENER, &filter));
}

// Relative to the directory; empty for what is elsewhere, no file, or only opened to be read.
std::string path_of(const seccomp_notif& asked, const watched_call& call) {
    if (call.number == SYS_clone) return "-";
    const std::string process = "/proc/" + std::to_string(asked.pid);
    const uint64_t argument = asked.data.args[call.argument];
    std::string path;
    if (call.number == SYS_openat && (asked.data.args[2] & (O_ACCMODE | O_CREAT)) == O_RDONLY) {
        return path;
    }
    if (call.has_path) {
        std::ifstream memory(process + "/mem", std::ios::binary);
        std::getline(memory.seekg(static_cast<std::streamoff>(argument)), path, '\0');
    } else {
        std::error_code closed;
        path = std::filesystem::read_symlink(process + "/fd/" + std::to_string(argument), closed);
        if (!path.starts_with(directory)) return {};
    }
    if (path.starts_with(directory)) path.erase(0, directory.size());
    return path.starts_with('/') ? std::string() : path;
}

void decide(const seccomp_notif& asked, seccomp_notif_resp& answer) {
    const auto* const call = std::ranges::find(watched, asked.data.nr, &watched_call::number);
    const std::string path = path_of(asked, *call);
    if (path.empty()) return;
    const auto process = static_cast<pid_t>(asked.pid);
    if (first_process == 0) first_process = process;
    const std::string what = std::string(call->name) + " " + path;
    const int number = ++made[std::to_string(process) + " " + what];
    const std::string made_now =
        (process == first_process ? "daemon " : "child ") + what + " " + std::to_string(number);
    if (std::ranges::find(calls, made_now) == calls.end()) calls.push_back(made_now);
    const bool is_later = was_hit && std::regex_match(what, std::regex(injected.later));
    if (!is_later && made_now != injected.call) return;
    was_hit = true;
    if (injected.result == killed) (void)kill(process, SIGKILL);
    answer = {asked.id, 0, static_cast<int>(std::max(injected.result, -4095L)), 0};
}

void answer_all(int listener) {
    for (;;) {
        seccomp_notif asked = {};
        if (ioctl(listener, SECCOMP_IOCTL_NOTIF_RECV, &asked) != 0) continue;
        seccomp_notif_resp answer = {asked.id, 0, 0, SECCOMP_USER_NOTIF_FLAG_CONTINUE};
        if (!has_ended && static_cast<pid_t>(asked.pid) != getpid()) decide(asked, answer);
        (void)ioctl(listener, SECCOMP_IOCTL_NOTIF_SEND, &answer);
    }
}

}  // namespace

bool inject(fault wanted) {
    static std::atomic<int> listener = -1;
    injected = std::move(wanted);
    directory = std::filesystem::current_path().string() + "/";
    std::thread([] {
        listener.wait(-1);
        answer_all(listener);
    }).detach();
    listener = filter_this_thread();
    listener.notify_one();
    return listener >= 0;
}

bool was_injected() { return was_hit; }
void end_injection() { has_ended = true; }
const std::vector<std::string>& recorded_calls() { return calls; }

}  // namespace kivd
