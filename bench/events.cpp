// How many events a second the daemon takes, and what one costs, against bare receivers that append
// the same bytes to a file.
#include <unistd.h>

#include <filesystem>
#include <string>

#include "bench/bare_receivers.h"
#include "bench/load.h"
#include "bench/measure.h"
#include "bench/sections.h"

namespace kivd::bench {

namespace {

enum class subject { one_a_wait, batched, daemon };
enum class counting { nothing, children_cpu, system_calls };

// What was measured in the rounds of one subject.
struct samples {
    std::vector<double> events_per_second;
    std::vector<double> cpu_us;         // per event, the receiving process alone
    std::vector<double> family_cpu_us;  // with all its children, in rounds of their own
    std::vector<double> system_calls;   // per event, the receiving thread
    std::vector<double> lone_system_calls;
};

struct load {
    size_t payload_size;
    unsigned events;
    unsigned lone_events;
};

constexpr unsigned warm_up_events = 2000;
constexpr useconds_t settle_us = 5'000;       // the scheduler's figures are up to date by then
constexpr useconds_t compactor_us = 150'000;  // the last compactor has ended by then
constexpr useconds_t lone_interval_us = 200;  // what arrives is alone in the queue
constexpr unsigned lone_group = 50;
constexpr double accepted_loss = 0.02;

child_process start_subject(const setup& s, subject who, const load& l,
                            const std::string& directory) {
    if (who == subject::daemon) {
        running_daemon daemon = start_daemon(s, directory, compression::off);
        const unique_fd control = connect_control(directory);
        (void)ask(control.get(), "IA");
        return std::move(daemon.process);
    }
    const auto kind = who == subject::batched ? receiver::batched : receiver::one_a_wait;
    return start_receiver(kind, directory, event_head_size(l.payload_size), event_payload_offset());
}

void send_events(int producer, const std::string& packet, unsigned count) {
    for (unsigned i = 0; i < count; ++i) send_packet(producer, packet);
    wait_until_taken(producer);
}

// System calls per event while each event finds the receiver asleep, in small groups: most have no
// start of a report among them.
void count_lone_system_calls(int producer, int counter, const std::string& packet, unsigned count,
                             std::vector<double>& into) {
    (void)usleep(settle_us);
    for (unsigned sent = 0; sent < count; sent += lone_group) {
        const int64_t before = read_counter(counter);
        for (unsigned i = 0; i < lone_group; ++i) {
            send_packet(producer, packet);
            (void)usleep(lone_interval_us);
        }
        into.push_back(static_cast<double>(read_counter(counter) - before) / lone_group);
    }
}

struct receiving_cost {
    double seconds;
    double cpu_us;  // per event
};

receiving_cost receive_load(pid_t pid, int producer, const std::string& packet, unsigned events,
                            useconds_t settle) {
    (void)usleep(settle);
    const int64_t cpu_before = process_cpu_ns(pid);
    const int64_t start = now_ns();
    send_events(producer, packet, events);
    const double seconds = static_cast<double>(now_ns() - start) / 1e9;
    (void)usleep(settle);
    return {seconds, static_cast<double>(process_cpu_ns(pid) - cpu_before) / 1e3 / events};
}

void take_children_cpu(pid_t pid, int producer, const std::string& packet, const load& l,
                       samples& into) {
    (void)usleep(compactor_us);  // a compactor of the warm-up doesn't count
    const unique_fd family = open_cpu_counter(pid, children::included);
    const unique_fd alone = open_cpu_counter(pid, children::left_out);
    if (!family.ok() || !alone.ok()) return;
    const receiving_cost cost = receive_load(pid, producer, packet, l.events, compactor_us);
    const int64_t children_ns = read_counter(family.get()) - read_counter(alone.get());
    into.family_cpu_us.push_back(cost.cpu_us + static_cast<double>(children_ns) / 1e3 / l.events);
}

void take_system_calls(pid_t pid, int producer, const std::string& packet, const load& l,
                       samples& into) {
    const unique_fd counter = open_system_call_counter(pid);
    if (!counter.ok()) return;
    (void)receive_load(pid, producer, packet, l.events, settle_us);
    into.system_calls.push_back(static_cast<double>(read_counter(counter.get())) / l.events);
    count_lone_system_calls(producer, counter.get(), packet, l.lone_events, into.lone_system_calls);
}

void take_samples(pid_t pid, counting what, const load& l, int producer, samples& into) {
    const std::string packet = event_packet(l.payload_size);
    send_events(producer, packet, warm_up_events);
    if (what == counting::children_cpu) return take_children_cpu(pid, producer, packet, l, into);
    if (what == counting::system_calls) return take_system_calls(pid, producer, packet, l, into);
    const receiving_cost cost = receive_load(pid, producer, packet, l.events, settle_us);
    into.events_per_second.push_back(l.events / cost.seconds);
    into.cpu_us.push_back(cost.cpu_us);
}

// Everything that was sent has to be on disk or in a report.
void check_stored_bytes(const std::string& directory, size_t reported, const load& l,
                        counting what) {
    std::error_code error;
    double stored = static_cast<double>(reported);
    const auto left = std::filesystem::file_size(directory + "/private/events", error);
    if (!error) stored += static_cast<double>(left);
    const unsigned lone = what == counting::system_calls ? l.lone_events : 0;
    const double sent = static_cast<double>(event_head_size(l.payload_size) + l.payload_size) *
                        (l.events + warm_up_events + lone);
    if (stored < sent * (1 - accepted_loss))
        print_note("warning: %.0f bytes of %.0f were stored", stored, sent);
}

void run_round(const setup& s, subject who, counting what, const load& l, samples& into) {
    const scratch_directory directory(s.scratch);
    child_process process = start_subject(s, who, l, directory.path());
    const unique_fd producer = connect_producer(directory.path());
    if (who != subject::daemon) {
        take_samples(process.pid(), what, l, producer.get(), into);
        (void)process.stop();
        return;
    }
    report_remover remover(directory.path());
    take_samples(process.pid(), what, l, producer.get(), into);
    (void)process.stop();
    check_stored_bytes(directory.path(), remover.finish(), l, what);
}

void print_rows(const samples& a, const samples& b, const samples& daemon, double rate_goal) {
    print_row("A: one packet a wait, 2 writes and a seek", a.events_per_second, "ev/s");
    print_row("B: batches, one writev a packet", b.events_per_second, "ev/s");
    print_row("kivd", daemon.events_per_second, "ev/s");
    print_row("events/s, kivd : A", ratios(daemon.events_per_second, a.events_per_second), "x",
              {bound::at_least, rate_goal});
    print_row("events/s, kivd : B", ratios(daemon.events_per_second, b.events_per_second), "x",
              {bound::at_least, 0.85});
    print_row("CPU an event, A", a.cpu_us, "us");
    print_row("CPU an event, B", b.cpu_us, "us");
    print_row("CPU an event, kivd without compactors", daemon.cpu_us, "us");
    print_row("CPU an event, kivd with compactors", daemon.family_cpu_us, "us");
    print_row("CPU an event, kivd without compactors : A", ratios(daemon.cpu_us, a.cpu_us), "x",
              {bound::at_most, 0.35});
    print_row("CPU an event, kivd with compactors : A",
              ratios(daemon.family_cpu_us, a.family_cpu_us), "x");
    print_row("system calls an event, full queue, A", a.system_calls, "");
    print_row("system calls an event, full queue, B", b.system_calls, "");
    print_row("system calls an event, full queue, kivd", daemon.system_calls, "",
              {bound::at_most, 1.3});
    print_row("system calls an event, alone, A", a.lone_system_calls, "");
    print_row("system calls an event, alone, kivd", daemon.lone_system_calls, "",
              {bound::at_most, 3});
}

void measure_load(const setup& s, const load& l, double rate_goal) {
    samples a;
    samples b;
    samples daemon;
    const auto run_all = [&](counting what, unsigned rounds) {
        for (unsigned i = 0; i < rounds; ++i) {
            run_round(s, subject::one_a_wait, what, l, a);
            run_round(s, subject::batched, what, l, b);
            run_round(s, subject::daemon, what, l, daemon);
        }
    };
    run_all(counting::nothing, amount(s, 9, 3));
    run_all(counting::children_cpu, amount(s, 3, 1));
    run_all(counting::system_calls, amount(s, 3, 1));
    print_rows(a, b, daemon, rate_goal);
}

}  // namespace

void measure_events(const setup& s) {
    print_section("Events of 64 bytes");
    measure_load(s,
                 {.payload_size = 64,
                  .events = amount(s, 200'000, 40'000),
                  .lone_events = amount(s, 2000, 500)},
                 2.5);
}

void measure_large_events(const setup& s) {
    print_section("Events of 512 bytes");
    measure_load(s,
                 {.payload_size = 512,
                  .events = amount(s, 100'000, 20'000),
                  .lone_events = amount(s, 1000, 250)},
                 1.5);
}

}  // namespace kivd::bench
