#include "reliability/torture/lives.h"

#include <gtest/gtest.h>

#include <atomic>
#include <csignal>
#include <fstream>
#include <list>
#include <thread>

#include "reliability/torture/kept_data.h"
#include "settings.pb.h"
#include "support/config_package.h"
#include "support/scratch_directory.h"

namespace kivd {
namespace {

using namespace std::string_literals;
using enum socket_kind;

// clang-format off
const exchange steps[life_steps] = {
    // events                      logged      values, request
    {{0, 10, 300, 5000},           {},         false,  ""},
    {{},                           {},         true,   "FS"},
    {{20},                         {},         false,  "FL"},
    {{20000, 20000, 20000, 20000}, {},         true,   ""},
    {{30},                         {},         false,  "FL"},
    {{40},                         {},         false,  "NC"},
    {{},                           {200, 20},  false,  ""},
    {{50},                         {},         true,   "FS"},
};
// clang-format on
constexpr size_t first_sealed_step = 4;
constexpr size_t almost_full = 204600;  // a diagnostics file that the next event fills

// Its events have the ids from `begin` to before `end`; those before `acknowledged` have to be
// there.
struct sender {
    explicit sender(int first) : begin(first), end(first), acknowledged(first) {}
    const int begin;
    std::atomic<int> end;
    int acknowledged;
};

// Until the daemon is gone. Sends all else in between, and asks now and then whether it lives.
void send_load(socket_kind kind, std::minstd_rand random, sender& own) {
    const unique_fd fd = connect_client(kind);
    const auto send = [&](const std::string& request) {
        // On a stream, what is read together is dropped together.
        if (kind == stream) return send_text(fd.get(), framed(request)) && wait_taken(fd.get());
        return send_text(fd.get(), request);
    };
    for (bool sent = true; sent;) {
        sent = send(event_request(plain_package, own.end++, random() % 2000));
        for (const auto& [request, odds] :
             {std::pair("CI p count 1", 50U), std::pair("FL", 200U), std::pair("FS", 200U)}) {
            if (sent && random() % odds == 0) sent = send(request);
        }
        if (!sent || kind == datagram || random() % 8 != 0) continue;
        sent = send("IA") && receive_text(fd.get()) == "1";
        if (sent) own.acknowledged = own.end;
    }
}

void kill_with_children(const daemon_process& daemon) {
    const std::string process = "/proc/" + std::to_string(daemon.pid());
    daemon.send_signal(SIGSTOP);  // or it could flush again before its own end
    const auto is_stopped = [&] {
        return read_file(process + "/status").find("State:\tT") != std::string::npos;
    };
    EXPECT_TRUE(wait_until(is_stopped));
    std::ifstream children(process + "/task/" + std::to_string(daemon.pid()) + "/children");
    for (pid_t child = 0; children >> child;) (void)kill(child, SIGKILL);
}

// Up to some point all is there that was sent, and nothing behind it.
void check_prefix(const sender& own, const std::set<int>& there) {
    int id = own.begin;
    while (there.contains(id)) ++id;
    EXPECT_GE(id, own.acknowledged);
    while (++id < own.end) EXPECT_FALSE(there.contains(id)) << id << " without those before it";
}

}  // namespace

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

void make_place(journal& noted) {
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
    write_file("private/qz/qz_1", event_record(diag_package, 1, almost_full));
    const std::string header = "\x0a\x08\x0a\0\x12\0\x1a\0\x22\0"s;
    const std::string event = event_record(plain_package, 2, 100);
    write_file("private/events", header + event + event.substr(0, 20));
    noted.last_id = 2;
    noted.sent = {1, 2};
    noted.logged = {1};
    noted.kept = {2};
}

void live(daemon_process& daemon, journal& noted, const std::function<void(size_t)>& before_step) {
    if (!daemon.wait_ready()) return;
    for (size_t step = 0; step < life_steps; ++step) {
        SCOPED_TRACE("step " + std::to_string(step));
        before_step(step);
        if (step == first_sealed_step) install_report_key(noted);
        if (!carry_out(steps[step], daemon, noted)) return;
    }
}

daemon_process kill_under_load(std::minstd_rand random, journal& noted) {
    int first[] = {ids_of_a_sender, 2 * ids_of_a_sender, 3 * ids_of_a_sender, 4 * ids_of_a_sender};
    daemon_process daemon = start_again(noted);
    for (int kills = 0; kills < kills_under_load; ++kills) {
        SCOPED_TRACE("kill " + std::to_string(kills));
        std::list<sender> senders(std::begin(first), std::end(first));
        {
            std::list<std::jthread> threads;
            const socket_kind kinds[] = {datagram, packets, packets, stream};
            for (const socket_kind* kind = kinds; sender & own : senders) {
                threads.emplace_back(send_load, *kind++, std::minstd_rand(random()), std::ref(own));
            }
            const int enough = static_cast<int>(random() % 1500);
            EXPECT_TRUE(wait_until([&] {
                int sent = 0;
                for (const sender& own : senders) sent += own.end - own.begin;
                return sent >= enough;
            }));
            std::this_thread::sleep_for(std::chrono::microseconds(random() % 2000));
            if (random() % 2 == 0) kill_with_children(daemon);
            daemon.send_signal(SIGKILL);
        }
        EXPECT_EQ(daemon.wait_exit(), 128 + SIGKILL);
        wait_orphans();
        for (int* next = first; const sender& own : senders) {
            for (*next = own.begin; *next < own.end; ++*next) noted.sent.insert(*next);
            for (int id = own.begin; id < own.acknowledged; ++id) noted.kept.insert(id);
            ++next;
        }
        const std::set<int> there = check_files(noted);
        for (const sender& own : senders) check_prefix(own, there);
        daemon = start_again(noted);
    }
    return daemon;
}

}  // namespace kivd
