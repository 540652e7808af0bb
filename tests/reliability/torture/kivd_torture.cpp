// One torture of a daemon: it is killed at a point of its life, its system calls fail, or its disk
// is taken away, and what is left is held against what it promises. script/torture does them all.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <csignal>
#include <cstdio>
#include <fstream>
#include <random>
#include <thread>

#include "bench/flood.h"
#include "end_to_end/daemon_test.h"
#include "reliability/torture/injection.h"
#include "reliability/torture/promises.h"
#include "settings.pb.h"
#include "support/config_package.h"

namespace kivd {
namespace {

constexpr int status_skipped = 77;
constexpr size_t log_limit = 600;       // lines; a flood would have many more
constexpr size_t almost_full = 204600;  // a diagnostics file that the next event fills

// A short life, always the same, in which the daemon changes files in all of its ways.
constexpr size_t first_sealed_step = 4;
constexpr const char* life[] = {"e0 e10 e300 e5000",
                                "values FS",
                                "e20 FL",
                                "e20000 e20000 e20000 e20000 values",
                                "e30 FL",
                                "e40 NC",
                                "l200 l20",
                                "e50 values FS"};

// In the current directory: the keys and the configuration of all lives.
void make_materials() {
    make_keys("config");
    make_keys("report");
    const std::string data = gzip(pack(
        {own_part<Settings>("Settings", "max_report_size: 400000"),
         own_part<RunActions>("RunActions", "activate_lumora_diagnostics: true"),
         own_part<kiv::config::FilterConfig>(
             "FilterConfig", "event_filter { type: EXCLUDE item { package: 'p' name: 'not' } }"),
         {"app", "part", "for the app"}}));
    write_file("config", config_file(data, sign(data, "config")));
}

std::string record_of(event_id id, size_t size) {
    kiv::Report report;
    kiv::Event& event = *report.add_events();
    event.set_package(event_package(id, size) + diag_package_end);
    event.set_name(event_name);
    event.set_timestamp(1);
    event.set_payload(payload_of(id, size));
    return report.SerializePartialAsString();
}

// A place in the current directory, with what an unhappy life may have left. Enters it.
journal make_place() {
    fs::create_directory("keys");
    fs::copy_file("../kiv_config.pem", "keys/kiv_config.pem");
    fs::create_directory("work");
    fs::current_path("work");
    for (const char* name : {"private/qz", "output", "input"}) fs::create_directories(name);
    write_file("private/header_info.conf", "id: product\n");
    for (const char* name : {"counters.txt_", "sdata.txt_", "kivd.state_tmp", "new_config.sig",
                             "flushed_data.compacted", "flushed_data.encrypted"}) {
        write_file("private/" + std::string(name), "cut of");
    }
    const event_id in_diagnostics = {first_client, 1};
    const event_id in_events = {first_client, 2};
    write_file("private/qz/qz_1", record_of(in_diagnostics, almost_full));
    const std::string event = record_of(in_events, 100);
    write_file("private/events", "\x0a\x08\x0a\0\x12\0\x1a\0\x22\0"s + event + event.substr(0, 20));
    journal noted;
    noted.last_number = in_events.number;
    noted.sent = {in_diagnostics, in_events};
    noted.logged = {in_diagnostics};
    noted.kept = {in_events};
    return noted;
}

// From step to step, until the last or until it doesn't answer.
void live(
    daemon_process& daemon, journal& noted,
    const std::function<void(size_t)>& before_step = [](size_t) {}) {
    if (!daemon.wait_ready()) return;
    for (size_t step = 0; step < std::size(life); ++step) {
        SCOPED_TRACE("step " + std::to_string(step));
        before_step(step);
        if (step == first_sealed_step) install_report_key(noted);
        if (!carry_out(life[step], daemon, noted)) return;
    }
}

void check_restart(journal& noted) {
    daemon_process daemon = start_again(noted);
    check_service_and_stop(daemon, noted);
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

// A life in which a call fails, or at which a process is killed.
void hit(const std::string& call, long result, const std::string& later) {
    journal noted = make_place();
    noted.kills_only = result == killed;
    const auto is_of = [&](const char* name) {
        return !noted.kills_only && call.find(name) != std::string::npos;
    };
    // A file that cannot be cut is removed, one that cannot be read is cut there.
    if (is_of(" truncate ") || is_of(" read private/events ")) noted.kept.clear();
    if (is_of(" read private/qz/")) noted.logged.clear();
    if (is_of(" read private/conf_")) noted.acknowledges = false;  // diagnostics stay off
    if (is_of(" statfs ")) noted.may_prune = true;  // nobody knows what room there is
    EXPECT_TRUE(inject({call, result, later}));
    daemon_process daemon = launch();
    live(daemon, noted);
    int status = daemon.wait_ready() ? 0 : 1;  // a start may be refused
    if (noted.kills_only) {
        status = call.starts_with("child") ? 0 : 128 + SIGKILL;
    } else if (status == 0 && was_injected()) {
        const bool tried_again = is_of(" writev ") && result == -EINTR;
        EXPECT_TRUE(!tried_again || errors(daemon) == 0) << daemon.log();
        check_recovery(daemon, noted, end_injection);
    }
    EXPECT_EQ(daemon.stop(), status) << daemon.log();
    EXPECT_TRUE(was_injected());
    end_injection();
    wait_orphans();
    check_restart(noted);
}

void fill_disk(size_t blocks_left) {
    const std::string block(4096, '\0');
    const unique_fd file(open("filler", O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600));
    off_t size = 0;
    while (write(file.get(), block.data(), block.size()) > 0) size += std::ssize(block);
    EXPECT_EQ(ftruncate(file.get(), size - static_cast<off_t>(blocks_left * block.size())), 0);
}

// On a small disk of its own.
void fill_at(size_t step, size_t blocks_left) {
    journal noted = make_place();
    daemon_process daemon = launch();
    live(daemon, noted, [&](size_t at) {
        if (at != step) return;
        noted.kills_only = false;
        noted.may_prune = true;
        note_seen(noted);
        fill_disk(blocks_left);
    });
    EXPECT_TRUE(blocks_left > 0 || errors(daemon) > 0) << "it isn't felt";
    check_recovery(daemon, noted, [] { fs::remove("filler"); });
    check_restart(noted);
}

// Of each client: up to some point all is there that it has sent, and nothing behind it.
void check_prefixes(const flood& clients, const std::vector<uint64_t>& begin, journal& noted) {
    const std::vector<uint64_t> end = clients.counts();
    std::vector<std::vector<event_id>> sent(end.size());
    for (size_t client = 0; client < end.size(); ++client) {
        for (event_id id = {client, begin[client]}; id.number < end[client]; ++id.number) {
            if (kind_of(id) != "EV") continue;
            sent[client].push_back(id);
            noted.sent.insert(id);
            if (id.number < clients.acknowledged(client)) noted.kept.insert(id);
        }
    }
    const std::set<event_id> there = check_files(noted);
    for (const auto& ids : sent) {
        EXPECT_TRUE(std::ranges::is_partitioned(ids, [&](auto& id) { return there.contains(id); }));
    }
}

// At random moments, some of them with the children, while clients of all kinds send and flush.
void kill_at_random(std::minstd_rand random) {
    journal noted = make_place();
    daemon_process daemon = start_again(noted);
    if (random() % 2 == 0) install_report_key(noted);
    flood clients(fs::current_path(), 3, 1);
    for (int kills = 0; kills < 5; ++kills) {
        SCOPED_TRACE("kill " + std::to_string(kills));
        const std::vector<uint64_t> begin = clients.counts();
        const uint64_t enough = clients.total() + random() % 3000;
        const std::chrono::microseconds more(random() % 2000);
        const bool all = random() % 2 == 0;
        const std::string pid = std::to_string(daemon.pid());
        {
            const std::jthread killing([&] {
                EXPECT_TRUE(wait_until([&] { return clients.total() >= enough; }));
                std::this_thread::sleep_for(more);
                std::ifstream children("/proc/" + pid + "/task/" + pid + "/children");
                std::vector<pid_t> killed(std::istream_iterator<pid_t>(children), {});
                daemon.send_signal(SIGKILL);
                for (const pid_t child : killed) (void)(all && kill(child, SIGKILL) == 0);
            });
            const unique_fd control = connect_client(socket_kind::packets);
            EXPECT_FALSE(clients.send([&] {
                for (const char* request : {"FL", "FS"}) {
                    if (random() % 20 == 0) send_text(control.get(), request);
                }
                return false;
            }));
        }
        EXPECT_EQ(daemon.wait_exit(), 128 + SIGKILL);
        wait_orphans();
        check_prefixes(clients, begin, noted);
        daemon = start_again(noted);
        clients.connect();
    }
    check_service_and_stop(daemon, noted);
}

// Leaves the keys and the configuration for all others beside their directories, and prints the
// calls of a life that have to do with files.
void record() {
    const fs::path own = fs::current_path();
    fs::current_path("..");
    make_materials();
    fs::current_path(own);
    journal noted = make_place();
    if (!inject({})) _exit(status_skipped);
    daemon_process daemon = launch();
    live(daemon, noted);
    EXPECT_EQ(daemon.stop(), 0);
    for (const std::string& call : recorded_calls()) puts(call.c_str());
}

// Valgrind says something only when there is an error or a leak, of a child's too.
void live_under_valgrind() {
    journal noted = make_place();
    daemon_process daemon =
        launch({"/bin/sh", "/usr/bin/valgrind", "--quiet", "--leak-check=full"});  // a script
    live(daemon, noted);
    EXPECT_EQ(daemon.stop(), 0);
    EXPECT_EQ(daemon.log().find("=="), std::string::npos) << daemon.log();
    check_restart(noted);
}

struct torture {
    const char* name;
    const char* arguments;
    int count;
    void (*run)(char** arguments);
};
constexpr torture tortures[] = {
    {"record", "", 0, [](char**) { record(); }},
    {"kill", "CALL", 1, [](char** a) { hit(a[0], killed, ""); }},
    {"fail", "CALL RESULT LATER", 3, [](char** a) { hit(a[0], std::stol(a[1]), a[2]); }},
    {"fill", "STEP BLOCKS", 2, [](char** a) { fill_at(std::stoul(a[0]), std::stoul(a[1])); }},
    {"load", "SEED", 1, [](char** a) { kill_at_random(std::minstd_rand(std::stoul(a[0]))); }},
    {"valgrind", "", 0, [](char**) { live_under_valgrind(); }},
};

}  // namespace
}  // namespace kivd

// NOLINTNEXTLINE(bugprone-exception-escape): one that gets here ends the program, as it should
int main(int argc, char** argv) {
    for (const auto& each : kivd::tortures) {
        if (argc - 2 != each.count || argv[1] != std::string(each.name)) continue;
        each.run(argv + 2);
        (void)fflush(stdout);
        _exit(testing::Test::HasFailure() ? 1 : 0);  // with no call that somebody is asked about
    }
    puts("In an empty directory in that of a record, one of:");
    for (const auto& each : kivd::tortures)
        printf("kivd_torture %s %s\n", each.name, each.arguments);
    return 2;
}
