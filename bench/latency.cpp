// How soon an idle daemon answers, against a bare server that answers every packet with one byte,
// and one that hundreds of clients flood.
#include <unistd.h>

#include <atomic>
#include <thread>

#include "bench/bare_receivers.h"
#include "bench/flood.h"
#include "bench/load.h"
#include "bench/measure.h"
#include "bench/sections.h"

namespace kivd::bench {

namespace {

constexpr size_t flood_connections = 500;
constexpr size_t flood_producers = 8;
constexpr useconds_t flood_pause_us = 5'000;

struct samples {
    std::vector<double> median_us;
    std::vector<double> slowest_us;  // the 99th percentile
};

void ping(int connection, unsigned count, samples& into, useconds_t pause = 0) {
    std::vector<double> times;
    for (unsigned i = 0; i < count; ++i) {
        const int64_t start = now_ns();
        if (ask(connection, "IA") != "1") give_up("IA not answered with 1");
        times.push_back(static_cast<double>(now_ns() - start) / 1e3);
        if (pause > 0) (void)usleep(pause);
    }
    into.median_us.push_back(percentile(times, 50));
    into.slowest_us.push_back(percentile(times, 99));
}

void measure_idle(const setup& s) {
    const scratch_directory bare_directory(s.scratch);
    child_process server = start_echo_server(bare_directory.path());
    const scratch_directory directory(s.scratch);
    daemon_process daemon = start_daemon(s, directory.path(), compression::off);
    const unique_fd bare_connection = connect_control(bare_directory.path());
    const unique_fd connection = connect_control(directory.path());

    // On one processor: to wake another one out of its sleep takes longer than all else, and
    // whether that is needed is the scheduler's choice.
    const pinned_thread client_pinned(0, 0);
    const pinned_thread server_pinned(server.pid(), 0);
    const pinned_thread daemon_pinned(daemon.pid(), 0);

    samples bare;
    samples real;
    samples unused;
    const unsigned count = amount(s, 2000, 500);
    ping(bare_connection.get(), count, unused);
    ping(connection.get(), count, unused);
    for (unsigned i = 0; i < amount(s, 25, 7); ++i) {
        ping(bare_connection.get(), count, bare);
        ping(connection.get(), count, real);
    }
    stop(daemon);
    stop(server);

    print_row("bare echo, 50th percentile", bare.median_us, "us");
    print_row("kivd, 50th percentile", real.median_us, "us");
    print_row("bare echo, 99th percentile", bare.slowest_us, "us");
    print_row("kivd, 99th percentile", real.slowest_us, "us");
    print_row("50th percentile, kivd : bare", ratios(real.median_us, bare.median_us), "x");
    print_row("99th percentile, kivd : bare", ratios(real.slowest_us, bare.slowest_us), "x",
              {bound::at_most, 1.3});
}

void measure_flooded(const setup& s) {
    const scratch_directory directory(s.scratch);
    daemon_process daemon = start_daemon(s, directory.path(), compression::on);
    const unique_fd connection = connect_control(directory.path());
    (void)ask(connection.get(), "IA");
    report_remover remover(directory.path());
    flood clients(directory.path(), flood_connections, flood_producers);
    samples flooded;
    for (unsigned i = 0; i < amount(s, 5, 2); ++i) {
        std::atomic<bool> is_enough = false;
        const std::jthread asking([&] {
            ping(connection.get(), amount(s, 500, 100), flooded, flood_pause_us);
            is_enough = true;
        });
        if (!clients.send([&] { return is_enough.load(); })) give_up("the daemon hangs up");
    }
    stop(daemon);
    (void)remover.finish();
    print_row("kivd flooded by 508 clients, 50th percentile", flooded.median_us, "us");
    print_row("kivd flooded by 508 clients, 99th percentile", flooded.slowest_us, "us",
              {bound::at_most, 50'000});
}

}  // namespace

void measure_latency(const setup& s) {
    print_section("An answer to IA");
    measure_idle(s);
    measure_flooded(s);
}

}  // namespace kivd::bench
