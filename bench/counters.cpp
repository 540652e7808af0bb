// What one counter increment costs among few and among many counters, and what a counter costs in
// memory.
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstring>
#include <random>

#include "bench/bare_receivers.h"
#include "bench/load.h"
#include "bench/measure.h"
#include "bench/sections.h"
#include "config/filters.h"
#include "daemon/request/handle_request.h"
#include "report/state_file.h"
#include "store/counters.h"

namespace kivd::bench {

namespace {

constexpr unsigned few = 100;
constexpr unsigned many = 10'000;
constexpr unsigned most = 20'000;
constexpr useconds_t settle_us = 5'000;
constexpr size_t packet_limit = 31177;

// One increment of each of `count` counters, in an order that no cache can foresee.
std::vector<std::string> increment_packets(unsigned count) {
    std::vector<std::string> packets;
    for (unsigned i = 0; i < count; ++i) packets.push_back(increment_packet(i));
    std::ranges::shuffle(packets, std::mt19937(count));
    return packets;
}

void send_increments(int producer, const std::vector<std::string>& packets, unsigned count) {
    for (unsigned i = 0; i < count; ++i) send_packet(producer, packets[i % packets.size()]);
    wait_until_taken(producer);
}

// CPU time of the receiver for one datagram, in us.
double cpu_per_datagram(pid_t pid, const std::string& directory, unsigned counters,
                        unsigned datagrams) {
    const std::vector<std::string> packets = increment_packets(counters);
    const unique_fd producer = connect_producer(directory);
    send_increments(producer.get(), packets, counters);
    (void)usleep(settle_us);
    const int64_t before = process_cpu_ns(pid);
    send_increments(producer.get(), packets, datagrams);
    (void)usleep(settle_us);
    return static_cast<double>(process_cpu_ns(pid) - before) / 1e3 / datagrams;
}

double bare_round(const setup& s, unsigned datagrams) {
    const scratch_directory directory(s.scratch);
    child_process process = start_receiver(receiver::batched_discard, directory.path(), 0, 0);
    return cpu_per_datagram(process.pid(), directory.path(), many, datagrams);
}

double daemon_round(const setup& s, unsigned counters, unsigned datagrams) {
    const scratch_directory directory(s.scratch);
    daemon_process daemon = start_daemon(s, directory.path(), compression::off);
    const double result = cpu_per_datagram(daemon.pid(), directory.path(), counters, datagrams);
    stop(daemon);
    return result;
}

// Time from a packet in the receive buffer to the incremented counter, in us, without any socket.
double time_in_process(unsigned counters, unsigned increments) {
    counters_init();
    (void)load_filters();
    set_data_collection(true);
    const std::vector<std::string> packets = increment_packets(counters);
    static char buffer[packet_limit + 1];
    const request_sender sender{-1, getuid(), nullptr};
    const auto run = [&](unsigned count) {
        for (unsigned i = 0; i < count; ++i) {
            const std::string& packet = packets[i % packets.size()];
            memcpy(buffer, packet.c_str(), packet.size() + 1);
            (void)handle_request(sender, {buffer, packet.size()});
        }
    };
    run(2 * counters);
    const int64_t start = now_ns();
    run(increments);
    return static_cast<double>(now_ns() - start) / 1e3 / increments;
}

double in_process_round(const setup& s, unsigned counters) {
    const unsigned increments = amount(s, 400'000, 100'000);
    double result = 0;
    run_in_child({&result, 1}, [&](std::span<double> figures) {
        if (chdir(s.scratch.c_str()) == -1) give_up("chdir failed");
        figures[0] = time_in_process(counters, increments);
    });
    return result;
}

void measure_through_socket(const setup& s) {
    std::vector<double> bare;
    std::vector<double> among_few;
    std::vector<double> among_many;
    std::vector<double> among_most;
    std::vector<double> beside_receive;
    const unsigned datagrams = amount(s, 200'000, 40'000);
    for (unsigned i = 0; i < amount(s, 7, 3); ++i) {
        bare.push_back(bare_round(s, datagrams));
        among_few.push_back(daemon_round(s, few, datagrams));
        among_many.push_back(daemon_round(s, many, datagrams));
        among_most.push_back(daemon_round(s, most, datagrams));
        beside_receive.push_back(among_many.back() - bare.back());
    }
    print_row("CPU a datagram, bare receiver that discards it", bare, "us");
    print_row("CPU an increment, kivd, 100 counters", among_few, "us");
    print_row("CPU an increment, kivd, 10,000 counters", among_many, "us");
    print_row("CPU an increment, kivd, 20,000 counters", among_most, "us");
    print_row("the same beside the bare receive, 10,000 counters", beside_receive, "us",
              {bound::at_most, 0.5});
    print_row("an increment with its receive, 20,000 : 100", ratios(among_most, among_few), "x",
              {bound::at_most, 1.1});
}

void measure_in_process(const setup& s) {
    std::vector<double> among_few;
    std::vector<double> among_many;
    std::vector<double> among_most;
    for (unsigned i = 0; i < amount(s, 7, 3); ++i) {
        among_few.push_back(in_process_round(s, few));
        among_many.push_back(in_process_round(s, many));
        among_most.push_back(in_process_round(s, most));
    }
    print_row("request to counter in process, 100 counters", among_few, "us");
    print_row("request to counter in process, 10,000 counters", among_many, "us",
              {bound::at_most, 0.5});
    print_row("request to counter in process, 20,000 counters", among_most, "us");
}

void measure_memory(const setup& s) {
    std::vector<double> bytes;
    for (unsigned i = 0; i < amount(s, 3, 1); ++i) {
        const scratch_directory directory(s.scratch);
        daemon_process daemon = start_daemon(s, directory.path(), compression::off);
        const pid_t pid = daemon.pid();
        // The first ones bring in whatever a packet needs, however many counters there are.
        for (unsigned n = 0; n < few; ++n) touch_counters(directory.path(), 1);
        (void)usleep(settle_us);
        const int64_t before = private_dirty_bytes(pid);
        touch_counters(directory.path(), most);
        (void)usleep(settle_us);
        bytes.push_back(static_cast<double>(private_dirty_bytes(pid) - before) / (most - 1));
        stop(daemon);
    }
    print_row("memory a counter", bytes, "bytes", {bound::at_most, 110});
}

}  // namespace

void measure_counters(const setup& s) {
    print_section("Counters");
    measure_in_process(s);
    measure_through_socket(s);
    measure_memory(s);
}

}  // namespace kivd::bench
