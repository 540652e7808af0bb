#include "bench/process.h"

#include <fcntl.h>
#include <linux/perf_event.h>
#include <signal.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <sstream>

#include "bench/measure.h"

namespace kivd::bench {

namespace {

constexpr int join_limit_ms = 60'000;

std::string proc_path(pid_t pid, const char* name) {
    return "/proc/" + std::to_string(pid) + "/" + name;
}

// The first number of a schedstat file: time on a processor, in ns.
int64_t read_schedstat(const std::string& path) {
    std::ifstream file(path);
    int64_t value = 0;
    file >> value;
    return value;
}

// The number behind `key` in a file of "key: number" lines.
int64_t read_field(const std::string& path, const std::string& key) {
    std::ifstream file(path);
    std::string line;
    while (std::getline(file, line)) {
        if (!line.starts_with(key)) continue;
        return strtoll(line.c_str() + key.size(), nullptr, 10);
    }
    return 0;
}

unique_fd open_counter(perf_event_attr& attributes, pid_t pid) {
    attributes.size = sizeof attributes;
    return unique_fd(static_cast<int>(
        syscall(SYS_perf_event_open, &attributes, pid, -1, -1, PERF_FLAG_FD_CLOEXEC)));
}

}  // namespace

int64_t stop(child_process& process) {
    const int64_t start = now_ns();
    if (process.stop() < 0) give_up("process %d did not end on SIGTERM", process.pid());
    return now_ns() - start;
}

void join(child_process& process) {
    if (process.wait_exit(join_limit_ms) != 0) give_up("a process did not end as it should");
}

child_process fork_child(const std::function<void()>& body) {
    (void)fflush(stdout);
    const pid_t parent = getpid();
    const pid_t pid = fork();
    if (pid == -1) give_up("fork: %s", strerror(errno));
    if (pid != 0) return child_process(pid);
    (void)prctl(PR_SET_PDEATHSIG, SIGKILL);
    (void)signal(SIGTERM, SIG_DFL);
    (void)signal(SIGINT, SIG_IGN);  // the terminal's ^C is for the parent, which ends us
    if (getppid() == parent) body();
    _exit(0);
}

void send_output_nowhere() {
    const int null = open("/dev/null", O_RDWR | O_CLOEXEC);
    for (int fd = 0; fd <= 2; ++fd) (void)dup2(null, fd);
}

void run_in_child(std::span<double> figures, const std::function<void(std::span<double>)>& body) {
    const size_t size = figures.size_bytes();
    void* const shared =
        mmap(nullptr, size, PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
    if (shared == MAP_FAILED) give_up("mmap: %s", strerror(errno));
    child_process process = fork_child([&] {
        body({static_cast<double*>(shared), figures.size()});
    });
    join(process);
    memcpy(figures.data(), shared, size);
    (void)munmap(shared, size);
}

int64_t run_program(const std::vector<std::string>& words) {
    std::vector<char*> arguments;
    for (const std::string& word : words) arguments.push_back(const_cast<char*>(word.c_str()));
    arguments.push_back(nullptr);
    const int64_t start = now_ns();
    child_process process = fork_child([&] {
        send_output_nowhere();
        (void)execvp(arguments[0], arguments.data());
        _exit(127);
    });
    join(process);
    return now_ns() - start;
}

scratch_directory::scratch_directory(const std::string& parent) {
    std::string name = parent + "/kivd-bench-XXXXXX";
    if (mkdtemp(name.data()) == nullptr) give_up("%s: %s", name.c_str(), strerror(errno));
    path_ = name;
}

scratch_directory::~scratch_directory() {
    std::error_code ignored;
    (void)std::filesystem::remove_all(path_, ignored);
}

pinned_thread::pinned_thread(pid_t pid, int processor) : pid_(pid), before_() {
    (void)sched_getaffinity(pid_, sizeof before_, &before_);
    cpu_set_t one;
    CPU_ZERO(&one);
    CPU_SET(processor, &one);
    (void)sched_setaffinity(pid_, sizeof one, &one);
}

pinned_thread::~pinned_thread() { (void)sched_setaffinity(pid_, sizeof before_, &before_); }

int64_t process_cpu_ns(pid_t pid) {
    int64_t sum = 0;
    std::error_code error;
    for (const auto& task : std::filesystem::directory_iterator(proc_path(pid, "task"), error))
        sum += read_schedstat(task.path() / "schedstat");
    return sum;
}

int64_t main_thread_cpu_ns(pid_t pid) {
    const std::string thread = "task/" + std::to_string(pid) + "/schedstat";
    return read_schedstat(proc_path(pid, thread.c_str()));
}

int64_t voluntary_switches(pid_t pid) {
    int64_t sum = 0;
    std::error_code error;
    for (const auto& task : std::filesystem::directory_iterator(proc_path(pid, "task"), error))
        sum += read_field(task.path() / "status", "voluntary_ctxt_switches:");
    return sum;
}

int64_t private_dirty_bytes(pid_t pid) {
    return read_field(proc_path(pid, "smaps_rollup"), "Private_Dirty:") * 1024;
}

int64_t resident_bytes(pid_t pid) {
    return read_field(proc_path(pid, "smaps_rollup"), "Rss:") * 1024;
}

unique_fd open_system_call_counter(pid_t thread) {
    std::ifstream file("/sys/kernel/tracing/events/raw_syscalls/sys_enter/id");
    uint64_t id = 0;
    if (!(file >> id)) return unique_fd();
    perf_event_attr attributes{};
    attributes.type = PERF_TYPE_TRACEPOINT;
    attributes.config = id;
    return open_counter(attributes, thread);
}

unique_fd open_cpu_counter(pid_t pid, children with) {
    perf_event_attr attributes{};
    attributes.type = PERF_TYPE_SOFTWARE;
    attributes.config = PERF_COUNT_SW_TASK_CLOCK;
    attributes.inherit = with == children::included ? 1 : 0;
    return open_counter(attributes, pid);
}

int64_t read_counter(int fd) {
    int64_t value = 0;
    if (read(fd, &value, sizeof value) != sizeof value) return 0;
    return value;
}

}  // namespace kivd::bench
