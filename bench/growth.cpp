// How costs grow: that of an event with the size of its payload, those of counters with how many of
// them there are.
#include <unistd.h>

#include <algorithm>
#include <cstdio>

#include "bench/bare_receivers.h"
#include "bench/load.h"
#include "bench/measure.h"
#include "bench/sections.h"

namespace kivd::bench {

namespace {

constexpr size_t payload_sizes[] = {0, 64, 512, 4096, 16384, 30720};
constexpr unsigned counter_counts[] = {100, 1'000, 10'000, 19'900};
constexpr unsigned most_events = 100'000;
constexpr size_t round_bytes = 50'000'000;
constexpr useconds_t settle_us = 5'000;

// CPU time of the receiver for one of `count` packets, in us.
double cpu_per_packet(pid_t pid, int producer, unsigned count,
                      const std::function<const std::string&(unsigned)>& packet) {
    (void)usleep(settle_us);
    const int64_t before = process_cpu_ns(pid);
    for (unsigned i = 0; i < count; ++i) send_packet(producer, packet(i));
    wait_until_taken(producer);
    (void)usleep(settle_us);
    return static_cast<double>(process_cpu_ns(pid) - before) / 1e3 / count;
}

double cpu_per_event(pid_t pid, const std::string& directory, size_t payload_size) {
    const unique_fd producer = connect_producer(directory);
    const std::string packet = event_packet(payload_size);
    const auto count = static_cast<unsigned>(
        std::min<size_t>(most_events, round_bytes / (payload_size + packet.size())));
    return cpu_per_packet(pid, producer.get(), count,
                          [&packet](unsigned) -> const std::string& { return packet; });
}

void measure_payload(const setup& s, size_t payload_size) {
    std::vector<double> bare;
    std::vector<double> daemon;
    for (unsigned i = 0; i < amount(s, 5, 2); ++i) {
        const scratch_directory bare_directory(s.scratch);
        child_process receiver =
            start_receiver(receiver::batched, bare_directory.path(), event_head_size(payload_size),
                           event_payload_offset());
        bare.push_back(cpu_per_event(receiver.pid(), bare_directory.path(), payload_size));
        stop(receiver);

        const scratch_directory directory(s.scratch);
        daemon_process kivd = start_daemon(s, directory.path(), compression::off);
        (void)ask(connect_control(directory.path()).get(), "IA");
        report_remover remover(directory.path());
        daemon.push_back(cpu_per_event(kivd.pid(), directory.path(), payload_size));
        stop(kivd);
        (void)remover.finish();
    }
    char title[64];
    (void)snprintf(title, sizeof title, "CPU an event of %zu bytes, kivd", payload_size);
    print_row(title, daemon, "us");
    print_row("the same, kivd : batched receiver", ratios(daemon, bare), "x");
}

// The time from a request to the answer of the IA behind it, in ms.
double time_order(int control, const char* request) {
    (void)usleep(settle_us);
    const int64_t start = now_ns();
    order(control, request);
    (void)ask(control, "IA");
    return static_cast<double>(now_ns() - start) / 1e6;
}

void measure_counter_count(const setup& s, unsigned counters) {
    std::vector<double> increment_us;
    std::vector<double> bytes;
    std::vector<double> save_ms;
    std::vector<double> flush_ms;
    std::vector<std::string> packets;
    for (unsigned i = 0; i < counters; ++i) packets.push_back(increment_packet(i));
    for (unsigned i = 0; i < amount(s, 5, 2); ++i) {
        const scratch_directory directory(s.scratch);
        daemon_process kivd = start_daemon(s, directory.path(), compression::off);
        const pid_t pid = kivd.pid();
        const unique_fd control = connect_control(directory.path());
        // The first ones bring in whatever a packet needs, however many counters there are.
        for (unsigned n = 0; n < 100; ++n) touch_counters(directory.path(), 1);
        const int64_t before = private_dirty_bytes(pid);
        touch_counters(directory.path(), counters);
        bytes.push_back(static_cast<double>(private_dirty_bytes(pid) - before) / counters);
        increment_us.push_back(cpu_per_packet(
            pid, connect_producer(directory.path()).get(), std::max(counters, most_events),
            [&](unsigned n) -> const std::string& { return packets[n % counters]; }));
        save_ms.push_back(time_order(control.get(), "FS"));
        flush_ms.push_back(time_order(control.get(), "FL"));
        stop(kivd);
    }
    char title[64];
    (void)snprintf(title, sizeof title, "%u counters, all of them changed", counters);
    print_section(title);
    print_row("CPU of an increment with its receive", increment_us, "us");
    print_row("memory a counter", bytes, "bytes");
    print_row("save, FS to the answer of the IA behind it", save_ms, "ms");
    print_row("flush, FL to the answer of the IA behind it", flush_ms, "ms");
}

}  // namespace

void measure_growth(const setup& s) {
    print_section("Events by the size of their payload, reports not compressed");
    for (const size_t size : payload_sizes) measure_payload(s, size);
    for (const unsigned counters : counter_counts) measure_counter_count(s, counters);
}

}  // namespace kivd::bench
