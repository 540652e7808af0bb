// Kills the daemon at every point of its life, makes its system calls fail and takes its disk away,
// and holds what is left each time against what it promises.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <algorithm>
#include <chrono>
#include <csignal>
#include <cstdio>
#include <map>
#include <regex>

#include "reliability/torture/injection.h"
#include "reliability/torture/lives.h"
#include "support/scratch_directory.h"

namespace kivd {
namespace {

constexpr int status_skipped = 77;
constexpr unsigned case_limit_s = 120;
constexpr size_t log_limit = 600;  // lines; a flood would have many more
constexpr char filler[] = "filler";
constexpr char valgrind_path[] = "/usr/bin/valgrind";

// A life that ends at a call, its own or that of a child.
void kill_at(const recording& all, const traced_call& hit, const fault& injected) {
    journal noted;
    make_place(noted);
    daemon_process daemon = launch(inject_arguments(all, hit, injected));
    live(daemon, noted);
    EXPECT_EQ(daemon.stop(), hit.by_child ? 0 : 128 + SIGKILL);
    EXPECT_TRUE(was_injected());
    wait_orphans();
    check_restart(noted);
}

// A daemon with a fault comes to rest, with few words; without it, it is as if nothing had been.
void check_recovery(daemon_process& daemon, journal& noted,
                    const std::function<void()>& end_fault) {
    wait_children(daemon);
    EXPECT_TRUE(daemon.wait_idle()) << "it doesn't come to rest";
    EXPECT_LT(daemon.count_in_log("\n"), log_limit);
    end_fault();
    check_service_and_stop(daemon, noted);
}

void fail_at(const recording& all, const traced_call& hit, const fault& injected) {
    journal noted;
    make_place(noted);
    noted.kills_only = false;
    if (hit.name == "truncate") noted.kept.clear();    // a file that cannot be cut is removed
    if (hit.name == "statfs") noted.may_prune = true;  // nobody knows what room there is
    daemon_process daemon = launch(inject_arguments(all, hit, injected));
    live(daemon, noted);
    const bool serves = daemon.wait_ready();
    if (serves && was_injected()) {
        const bool tried_again =
            hit.name == "writev" && injected.what == std::string("error=EINTR");
        EXPECT_TRUE(!tried_again || errors(daemon) == 0) << daemon.log();
        check_recovery(daemon, noted, [&] { end_injection(daemon); });
    }
    EXPECT_EQ(daemon.stop(), serves ? 0 : 1) << daemon.log();  // a start may be refused
    EXPECT_TRUE(was_injected());
    check_restart(noted);
}

bool mount_small_disk(const char* place) {
    return unshare(CLONE_NEWNS) == 0 &&
           mount("none", "/", nullptr, MS_REC | MS_PRIVATE, nullptr) == 0 &&
           mount("disk", place, "tmpfs", 0, "mode=755,size=4m") == 0;
}

void fill_disk(size_t blocks_left) {
    const std::string block(4096, '\0');
    const unique_fd file(open(filler, O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600));
    off_t size = 0;
    while (write(file.get(), block.data(), block.size()) > 0) size += std::ssize(block);
    EXPECT_EQ(ftruncate(file.get(), size - static_cast<off_t>(blocks_left * block.size())), 0);
}

void fill_at(size_t step, size_t blocks_left) {
    journal noted;
    fs::create_directory("work");
    if (!mount_small_disk("work")) _exit(status_skipped);  // not permitted
    make_place(noted);
    daemon_process daemon = launch();
    live(daemon, noted, [&](size_t at) {
        if (at != step) return;
        noted.kills_only = noted.acknowledges = false;
        noted.may_tear = noted.may_prune = true;
        note_seen(noted);
        fill_disk(blocks_left);
    });
    EXPECT_TRUE(blocks_left > 0 || errors(daemon) > 0) << "it isn't felt";
    check_recovery(daemon, noted, [] { fs::remove(filler); });
    check_restart(noted);
    if (testing::Test::HasFailure()) (void)!system("cp -a . ../left");  // before the disk goes
}

// Valgrind says something only when there is an error or a leak, of a child's too.
void live_under_valgrind() {
    journal noted;
    make_place(noted);
    daemon_process daemon =
        launch({"/bin/sh", valgrind_path, "--quiet", "--leak-check=full"});  // it is a script
    live(daemon, noted);
    EXPECT_EQ(daemon.stop(), 0);
    EXPECT_EQ(daemon.log().find("=="), std::string::npos) << daemon.log();
    check_restart(noted);
}

void kill_at_random(std::minstd_rand random) {
    journal noted;
    make_place(noted);
    if (random() % 2 == 0) install_report_key(noted);
    daemon_process daemon = kill_under_load(random, noted);
    check_service_and_stop(daemon, noted);
}

// What is done to which calls.
struct injection {
    const char* kind;
    fault injected;
    void (*run)(const recording&, const traced_call&, const fault&);
    const char* calls;  // a regular expression
};
// clang-format off
constexpr injection injections[] = {
    {"kill", {"signal=SIGKILL", false}, kill_at, "(?!close|statfs).*"},
    {"full", {"error=ENOSPC", true},    fail_at, "(?!close|statfs|clone).*"},
    {"full", {"error=EDQUOT", true},    fail_at, "(?!close|statfs|clone).*"},
    {"once", {"error=EIO", false},      fail_at, "(?!clone).*"},
    {"once", {"error=EROFS", false},    fail_at, "(?!close|statfs|clone).*"},
    {"once", {"error=EINTR", false},    fail_at, "write.*"},
    {"once", {"retval=0", false},       fail_at, "write.*"},
    {"once", {"error=EAGAIN", false},   fail_at, "clone"},
};
// clang-format on

struct torture_case {
    std::string kind;
    std::string name;
    std::function<void()> run;
};
using case_list = std::vector<torture_case>;

void add_injections(case_list& cases, const recording& all) {
    for (const traced_call& call : all.calls) {
        const bool shared = !all.paths[call.by_child].contains(call.path);
        for (const injection& each : injections) {
            if (!std::regex_match(call.name, std::regex(each.calls))) continue;
            if (shared && each.injected.lasting) continue;
            cases.push_back({each.kind,
                             (call.by_child ? "child: " : "daemon: ") + call.name + " " +
                                 std::to_string(call.number) + " " + call.path + " " +
                                 each.injected.what,
                             [&all, &each, call] { each.run(all, call, each.injected); }});
        }
    }
}

void add_random(case_list& cases, std::minstd_rand& random) {
    for (size_t i = 0; i < 8 * life_steps; ++i) {
        const size_t step = i / 8;
        const size_t blocks = i % 8 == 0 ? 0 : random() % 16;
        cases.push_back({"disk", std::to_string(blocks) + " blocks from step " + std::to_string(i),
                         [step, blocks] { fill_at(step, blocks); }});
    }
    cases.push_back({"valgrind", "a life", live_under_valgrind});
    for (int i = 0; i < 30; ++i) {
        cases.push_back({"load", "load " + std::to_string(i),
                         [seed = random()] { kill_at_random(std::minstd_rand(seed)); }});
    }
}

struct options {
    std::vector<std::string> kinds;
    std::string only;
    unsigned seed = 1;
    unsigned round = 0;
    size_t sample = 0;
    double hours = 0;
};

// Runs a case in a process and a directory of its own; gives the exit status.
int run(const torture_case& wanted, const std::string& directory) {
    fs::create_directory(directory);
    fflush(nullptr);
    const pid_t child = fork();
    if (child == 0) {
        alarm(case_limit_s);
        fs::current_path(directory);
        SCOPED_TRACE(wanted.name);
        wanted.run();
        fflush(nullptr);
        _exit(testing::Test::HasFailure() ? 1 : 0);
    }
    int status = 0;
    (void)waitpid(child, &status, 0);
    if (status == 0 || WEXITSTATUS(status) == status_skipped) fs::remove_all(directory);
    return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

recording record_life() {
    fs::create_directory("recorded");
    fs::current_path("recorded");
    journal noted;
    make_place(noted);
    daemon_process daemon = launch(record_arguments());
    live(daemon, noted);
    EXPECT_EQ(daemon.stop(), 0);
    recording all = read_recording();
    fs::current_path("../..");
    return all;
}

// Those of a round that are wanted, in an order of its own.
case_list make_round(const recording& all, const options& given, unsigned round) {
    std::seed_seq seeds = {given.seed, round};
    std::minstd_rand random(seeds);
    case_list cases;
    add_injections(cases, all);
    add_random(cases, random);
    std::ranges::shuffle(cases, random);
    std::map<std::string, size_t> left;
    std::erase_if(cases, [&](const torture_case& each) {
        const auto& kinds = given.kinds;
        if (!kinds.empty() && std::ranges::find(kinds, each.kind) == kinds.end()) return true;
        if (!given.only.empty() && each.name != given.only) return true;
        return given.sample > 0 && ++left[each.kind] > given.sample;
    });
    return cases;
}

int torture(const options& given) {
    using hours = std::chrono::duration<double, std::ratio<3600>>;
    const auto end = std::chrono::steady_clock::now() + hours(given.hours);
    std::string directory = testing::TempDir() + "kivd-torture-XXXXXX";
    if (mkdtemp(directory.data()) == nullptr) return 1;
    fs::current_path(directory);
    make_materials();
    const bool traceable = system((std::string(strace_path) + " -o /dev/null true").c_str()) == 0;
    if (!traceable) puts("Without kill, full and once: strace is missing or not permitted.");
    const recording all = traceable ? record_life() : recording();

    std::map<std::string, int> passed;
    int failed = 0;
    int number = 0;
    unsigned round = given.round;
    do {
        printf("Seed %u, round %u\n", given.seed, round);
        for (const torture_case& each : make_round(all, given, round)) {
            const std::string place = "case-" + std::to_string(++number);
            const int status = run(each, place);
            if (status == status_skipped) continue;
            if (status == 0) {
                ++passed[each.kind];
                continue;
            }
            ++failed;
            printf("FAILED: %s --seed %u --round %u --only '%s', status %d, see %s/%s\n",
                   each.kind.c_str(), given.seed, round, each.name.c_str(), status,
                   directory.c_str(), place.c_str());
        }
        ++round;
    } while (std::chrono::steady_clock::now() < end);
    for (const auto& [kind, cases] : passed) printf("%s: %d passed\n", kind.c_str(), cases);
    printf("%d failed\n", failed);
    if (failed > 0) return 1;
    fs::current_path("/");
    fs::remove_all(directory);
    return passed.empty() ? status_skipped : 0;
}

}  // namespace
}  // namespace kivd

// NOLINTNEXTLINE(bugprone-exception-escape): one that gets here ends the program, as it should
int main(int argc, char** argv) {
    CLI::App app("Tortures kivd and holds it to its promises.");
    kivd::options given;
    app.add_option("kinds", given.kinds, "Of kill, full, once, disk, load, valgrind; all of them");
    app.add_option("--only", given.only, "The case of this name");
    app.add_option("--seed", given.seed, "What is random follows from it and the round");
    app.add_option("--round", given.round, "The first round");
    app.add_option("--hours", given.hours, "Begins rounds for so long, at least one");
    app.add_option("--sample", given.sample, "So many of each kind in a round; 0 for all");
    CLI11_PARSE(app, argc, argv);
    return kivd::torture(given);
}
