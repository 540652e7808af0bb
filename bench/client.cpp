// What a producer pays for a call of libkiv: beside the kernel's own send, from eight threads on
// one handle, and while the daemon is stopped.
#include <sys/socket.h>
#include <sys/un.h>

#include <algorithm>
#include <csignal>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "bench/load.h"
#include "bench/measure.h"
#include "bench/sections.h"
#include "client/kiv.h"

namespace kivd::bench {

namespace {

constexpr unsigned burst = 8;  // has room in the queue
constexpr unsigned thread_count = 8;
constexpr size_t payload_size = 64;
constexpr char package[] = "com.example.app";
constexpr char event_name[] = "event";

// Receives in place of a daemon.
unique_fd listen_in(const std::string& directory) {
    unique_fd fd(socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    sockaddr_un address = {};
    address.sun_family = AF_UNIX;
    (directory + "/kiv_cl").copy(address.sun_path, sizeof address.sun_path - 1);
    if (bind(fd.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
        give_up("cannot listen in %s", directory.c_str());
    }
    return fd;
}

void drain(int receiver) {
    char packet[256];
    while (recv(receiver, packet, sizeof packet, MSG_DONTWAIT) > 0) {
    }
}

// The time that one call takes, in us, over many bursts that never fill the queue.
double time_call(int receiver, unsigned bursts, auto call) {
    int64_t taken_ns = 0;
    for (unsigned i = 0; i < bursts; ++i) {
        const int64_t start = now_ns();
        for (unsigned j = 0; j < burst; ++j) call();
        taken_ns += now_ns() - start;
        drain(receiver);
    }
    return static_cast<double>(taken_ns) / 1e3 / burst / bursts;
}

void measure_beside_send(const setup& s) {
    const scratch_directory directory(s.scratch);
    const unique_fd receiver = listen_in(directory.path());
    const unique_fd bare = connect_producer(directory.path());
    kiv_handle* const kiv = kiv_create_from_path(directory.path().c_str());
    if (kiv == nullptr) give_up("no handle");
    const std::string packet = event_packet(payload_size);
    const std::string_view payload = std::string_view(packet).substr(event_payload_offset());

    std::vector<double> bare_us;
    std::vector<double> library_us;
    std::vector<double> beside_us;
    for (unsigned i = 0; i < amount(s, 25, 7); ++i) {
        const unsigned bursts = amount(s, 5000, 1000);
        bare_us.push_back(time_call(receiver.get(), bursts, [&] {
            (void)send(bare.get(), packet.data(), packet.size(), MSG_NOSIGNAL);
        }));
        library_us.push_back(time_call(receiver.get(), bursts, [&] {
            if (kiv_add_event(kiv, package, event_name, payload.data(), payload.size()) != 0) {
                give_up("an event was not taken");
            }
        }));
        beside_us.push_back(library_us.back() - bare_us.back());
    }
    kiv_destroy(kiv);
    print_row("bare send", bare_us, "us");
    print_row("kiv_add_event", library_us, "us");
    print_row("kiv_add_event beside the send", beside_us, "us", {bound::at_most, 3});
}

// Whatever becomes of them: the slowest of many calls, in us.
double slowest_call(kiv_handle* kiv, unsigned calls) {
    int64_t slowest_ns = 0;
    for (unsigned i = 0; i < calls; ++i) {
        const int64_t start = now_ns();
        (void)kiv_add_event(kiv, package, event_name, "x", 1);
        slowest_ns = std::max(slowest_ns, now_ns() - start);
    }
    return static_cast<double>(slowest_ns) / 1e3;
}

void measure_stopped_daemon(const setup& s) {
    const scratch_directory directory(s.scratch);
    daemon_process daemon = start_daemon(s, directory.path(), compression::off);
    (void)ask(connect_control(directory.path()).get(), "IA");
    kiv_handle* const kiv = kiv_create_from_path(directory.path().c_str());
    if (kiv == nullptr) give_up("no handle");
    if (kill(daemon.pid(), SIGSTOP) != 0) give_up("cannot stop the daemon");
    std::vector<double> slowest_us;
    for (unsigned i = 0; i < amount(s, 25, 7); ++i) slowest_us.push_back(slowest_call(kiv, 2000));
    (void)kill(daemon.pid(), SIGCONT);
    stop(daemon);
    kiv_destroy(kiv);
    print_row("slowest of 2000 calls, daemon stopped", slowest_us, "us", {bound::at_most, 1000});
}

// Events that the daemon takes from threads that share a handle and wait for room.
void measure_threads(const setup& s) {
    const scratch_directory directory(s.scratch);
    daemon_process daemon = start_daemon(s, directory.path(), compression::off);
    (void)ask(connect_control(directory.path()).get(), "IA");
    kiv_handle* const kiv = kiv_create_from_path(directory.path().c_str());
    if (kiv == nullptr) give_up("no handle");
    kiv_set_wait(kiv, 5000);
    const auto rate_with = [&](unsigned threads) {
        const unsigned each = amount(s, 80000, 16000) / threads;
        const int64_t start = now_ns();
        {
            std::vector<std::jthread> running;
            for (unsigned i = 0; i < threads; ++i) {
                running.emplace_back([kiv, each] {
                    for (unsigned j = 0; j < each; ++j) {
                        (void)kiv_add_event(kiv, package, event_name, "x", 1);
                    }
                });
            }
        }
        return each * threads / (static_cast<double>(now_ns() - start) / 1e9);
    };
    std::vector<double> one;
    std::vector<double> eight;
    for (unsigned i = 0; i < amount(s, 15, 5); ++i) {
        one.push_back(rate_with(1));
        eight.push_back(rate_with(thread_count));
    }
    if (kiv_dropped(kiv) != 0) give_up("events were dropped");
    stop(daemon);
    kiv_destroy(kiv);
    print_row("events a second, 1 thread", one, "");
    print_row("events a second, 8 threads, one handle", eight, "");
}

}  // namespace

void measure_client(const setup& s) {
    print_section("A call of libkiv");
    measure_beside_send(s);
    measure_threads(s);
    measure_stopped_daemon(s);
}

}  // namespace kivd::bench
