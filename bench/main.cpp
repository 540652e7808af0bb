// Measures the daemon side by side with bare yardsticks and prints the ratios. Nothing here passes
// or fails: the status says only whether the measurements could be taken.
#include <getopt.h>
#include <signal.h>
#include <sys/utsname.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <string_view>

#include "bench/measure.h"
#include "bench/sections.h"

using namespace kivd::bench;

namespace {

constexpr time_t run_limit_seconds = 1800;

struct section {
    std::string_view name;
    void (*measure)(const setup&);
};
constexpr section sections[] = {
    {"events", measure_events},       {"large_events", measure_large_events},
    {"counters", measure_counters},   {"flush", measure_flush},
    {"save", measure_save},           {"compaction", measure_compaction},
    {"filters", measure_filters},     {"intake", measure_intake},
    {"sealing", measure_sealing},     {"growth", measure_growth},
    {"latency", measure_latency},     {"client", measure_client},
    {"footprint", measure_footprint},
};

int print_usage() {
    fprintf(stderr,
            "Syntax: kivd_bench [--quick] [--kivd PATH] [--scratch DIRECTORY] [SECTION...]"
            "\nSections:");
    for (const auto& known : sections)
        fprintf(stderr, " %.*s", static_cast<int>(known.name.size()), known.name.data());
    fprintf(stderr, "\n");
    return 2;
}

// The daemon that was built together with this program.
std::string neighbour(const char* name) {
    std::error_code error;
    return (std::filesystem::read_symlink("/proc/self/exe", error).parent_path() / name).string();
}

struct processor_times {
    long long idle;
    long long all;
};

processor_times read_processor_times() {
    std::ifstream file("/proc/stat");
    std::string word;
    processor_times result{};
    file >> word;
    for (int field = 0; field < 8; ++field) {  // user, nice, system, idle, ... steal
        long long ticks = 0;
        file >> ticks;
        if (field == 3) result.idle = ticks;
        result.all += ticks;
    }
    return result;
}

// How much of the processors nobody else uses: below 90 or so the figures deserve no trust.
double idle_percent() {
    const processor_times before = read_processor_times();
    (void)sleep(2);
    const processor_times after = read_processor_times();
    return 100.0 * static_cast<double>(after.idle - before.idle) /
           static_cast<double>(std::max(1LL, after.all - before.all));
}

void print_machine() {
    utsname system{};
    (void)uname(&system);
    printf("%ld processors, %s %s %s\n", sysconf(_SC_NPROCESSORS_ONLN), system.sysname,
           system.release, system.machine);
    printf("%.0f %% idle before the start\n", idle_percent());
    (void)fflush(stdout);
}

// Runs until the measurements have ended, a signal asks to stop or the time is up; false unless
// they have ended well.
bool supervise(kivd::child_process& worker, const sigset_t& signals) {
    const int64_t deadline = now_ns() + int64_t{run_limit_seconds} * 1'000'000'000;
    while (now_ns() < deadline) {
        const timespec rest{.tv_sec = 1, .tv_nsec = 0};
        const int signal_number = sigtimedwait(&signals, nullptr, &rest);
        if (signal_number == SIGINT || signal_number == SIGTERM) return false;
        if (const int status = worker.wait_exit(0); status >= 0) return status == 0;
    }
    fprintf(stderr, "kivd_bench: still not done, stopped\n");
    return false;
}

}  // namespace

int main(int argc, char** argv) {
    setup s{.kivd = neighbour("kivd"), .scratch = "", .quick = false};
    std::string scratch_parent = std::filesystem::temp_directory_path().string();
    constexpr option options[] = {{"quick", no_argument, nullptr, 'q'},
                                  {"kivd", required_argument, nullptr, 'k'},
                                  {"scratch", required_argument, nullptr, 's'},
                                  {nullptr, 0, nullptr, 0}};
    for (int found = 0; (found = getopt_long(argc, argv, "", options, nullptr)) != -1;) {
        if (found == 'q') s.quick = true;
        if (found == 'k') s.kivd = std::filesystem::absolute(optarg).string();
        if (found == 's') scratch_parent = std::filesystem::absolute(optarg).string();
        if (found == '?') return print_usage();
    }
    for (int i = optind; i < argc; ++i) {
        if (std::ranges::find(sections, std::string_view(argv[i]), &section::name) ==
            std::end(sections))
            return print_usage();
    }
    if (access(s.kivd.c_str(), X_OK) == -1) {
        fprintf(stderr, "kivd_bench: %s: %s\n", s.kivd.c_str(), strerror(errno));
        return 1;
    }

    // The measurements run in a process of their own, so that whatever becomes of them, what they
    // started dies with them and this process removes their files.
    sigset_t signals;
    (void)sigemptyset(&signals);
    for (const int number : {SIGINT, SIGTERM, SIGCHLD}) (void)sigaddset(&signals, number);
    (void)sigprocmask(SIG_BLOCK, &signals, nullptr);
    const scratch_directory scratch(scratch_parent);
    s.scratch = scratch.path();
    print_machine();
    kivd::child_process worker = fork_child([&] {
        (void)sigprocmask(SIG_UNBLOCK, &signals, nullptr);
        for (const auto& known : sections) {
            const bool wanted =
                optind == argc || std::find(argv + optind, argv + argc, known.name) != argv + argc;
            if (wanted) known.measure(s);
        }
    });
    return supervise(worker, signals) ? 0 : 1;
}
