// How many events a second the daemon takes, and what one costs, against bare receivers that append
// the same bytes to a file.
#include <unistd.h>

#include <filesystem>
#include <optional>
#include <string>

#include "bench/bare_receivers.h"
#include "bench/load.h"
#include "bench/measure.h"
#include "bench/sections.h"

namespace kivd::bench {

namespace {

enum class subject { one_a_wait, batched, gathered, daemon };

struct load {
    size_t payload_size;
    compression compress;
    unsigned events;
    unsigned lone_events;
    unsigned bursts;
};

// What was measured in the rounds of one subject.
struct samples {
    std::vector<double> events_per_second;
    std::vector<double> between_reports;  // the same in bursts that start no report
    std::vector<double> cpu_us;           // per event, the receiving process alone
    std::vector<double> family_cpu_us;    // with its children, in rounds of their own
    std::vector<double> system_calls;     // per event, the receiving thread
    std::vector<double> lone_system_calls;
};

// A subject at work and the producer that keeps it there.
struct round {
    subject who;
    pid_t pid;
    std::string directory;
    unique_fd producer;
    std::string packet;
    size_t record_size;
    uint64_t sent = 0;
};

constexpr unsigned warm_up_events = 2000;
constexpr useconds_t settle_us = 5'000;       // the scheduler's figures are up to date by then
constexpr useconds_t compactor_us = 150'000;  // the last compactor has ended by then
constexpr useconds_t lone_interval_us = 200;  // what arrives is alone in the queue
constexpr unsigned lone_group = 50;
constexpr size_t burst_bytes = 380'000;        // with what opens it, less than makes a report
constexpr unsigned burst_opening_events = 10;  // not timed: they make the event file
constexpr int64_t report_limit_ns = 5'000'000'000;
constexpr double accepted_loss = 0.02;

child_process start_subject(const setup& s, subject who, const load& l,
                            const std::string& directory) {
    if (who == subject::daemon) {
        daemon_process daemon = start_daemon(s, directory, l.compress);
        const unique_fd control = connect_control(directory);
        (void)ask(control.get(), "IA");
        return daemon;
    }
    const receiver kind = who == subject::gathered  ? receiver::gathered
                          : who == subject::batched ? receiver::batched
                                                    : receiver::one_a_wait;
    return start_receiver(kind, directory, event_head_size(l.payload_size), event_payload_offset(),
                          l.compress == compression::on ? gzip_level::best : gzip_level::stored);
}

void send_events(round& r, unsigned count) {
    for (unsigned i = 0; i < count; ++i) send_packet(r.producer.get(), r.packet);
    wait_until_taken(r.producer.get());
    r.sent += count;
}

struct receiving_cost {
    double seconds;
    double cpu_us;  // per event
};

receiving_cost receive_load(round& r, unsigned events, useconds_t settle) {
    (void)usleep(settle);
    const int64_t cpu_before = process_cpu_ns(r.pid);
    const int64_t start = now_ns();
    send_events(r, events);
    const double seconds = static_cast<double>(now_ns() - start) / 1e9;
    (void)usleep(settle);
    return {seconds, static_cast<double>(process_cpu_ns(r.pid) - cpu_before) / 1e3 / events};
}

void take_rates(round& r, const load& l, samples& into) {
    const receiving_cost cost = receive_load(r, l.events, settle_us);
    into.events_per_second.push_back(l.events / cost.seconds);
    into.cpu_us.push_back(cost.cpu_us);
}

// Has the daemon make a report and waits until its compactor has ended.
void make_report(const std::string& directory) {
    const unique_fd control = connect_control(directory);
    order(control.get(), "FL");
    (void)ask(control.get(), "IA");
    const std::string unfinished = directory + "/private/flushed_data";
    const int64_t deadline = now_ns() + report_limit_ns;
    while (access(unfinished.c_str(), F_OK) == 0) {
        if (now_ns() > deadline) give_up("no report came of a flush");
        (void)usleep(500);
    }
    (void)usleep(settle_us);
}

// A burst is over before the scheduler has found out that both sides are busy, so they get a
// processor each.
void take_bursts(round& r, const load& l, samples& into) {
    const pinned_thread sender(0, 0);
    const pinned_thread receiver(r.pid, 1);
    const auto events = static_cast<unsigned>(burst_bytes / r.record_size);
    std::vector<double> rates;
    for (unsigned i = 0; i < l.bursts; ++i) {
        if (r.who == subject::daemon) make_report(r.directory);
        (void)usleep(settle_us);
        send_events(r, burst_opening_events);
        const int64_t start = now_ns();
        send_events(r, events);
        rates.push_back(events / (static_cast<double>(now_ns() - start) / 1e9));
    }
    into.between_reports.push_back(median(rates));
}

void take_children_cpu(round& r, const load& l, samples& into) {
    (void)usleep(compactor_us);  // a compactor of the warm-up doesn't count
    const unique_fd family = open_cpu_counter(r.pid, children::included);
    const unique_fd alone = open_cpu_counter(r.pid, children::left_out);
    if (!family.ok() || !alone.ok()) return;
    const receiving_cost cost = receive_load(r, l.events, compactor_us);
    const int64_t children_ns = read_counter(family.get()) - read_counter(alone.get());
    into.family_cpu_us.push_back(cost.cpu_us + static_cast<double>(children_ns) / 1e3 / l.events);
}

// In small groups, so that most have no start of a report among them.
void count_lone_system_calls(round& r, int counter, unsigned count, samples& into) {
    (void)usleep(settle_us);
    for (unsigned sent = 0; sent < count; sent += lone_group) {
        const int64_t before = read_counter(counter);
        for (unsigned i = 0; i < lone_group; ++i) {
            send_packet(r.producer.get(), r.packet);
            (void)usleep(lone_interval_us);
        }
        r.sent += lone_group;
        into.lone_system_calls.push_back(static_cast<double>(read_counter(counter) - before) /
                                         lone_group);
    }
}

void take_system_calls(round& r, const load& l, samples& into) {
    const unique_fd counter = open_system_call_counter(r.pid);
    if (!counter.ok()) return;
    (void)receive_load(r, l.events, settle_us);
    into.system_calls.push_back(static_cast<double>(read_counter(counter.get())) / l.events);
    count_lone_system_calls(r, counter.get(), l.lone_events, into);
}

// Everything that was sent has to be in a report, of which `reported` bytes have been deleted, or
// in the event file.
void check_stored_bytes(const round& r, size_t reported) {
    std::error_code error;
    double stored = static_cast<double>(reported);
    const auto left = std::filesystem::file_size(r.directory + "/private/events", error);
    if (!error) stored += static_cast<double>(left);
    const double sent = static_cast<double>(r.sent) * static_cast<double>(r.record_size);
    if (stored < sent * (1 - accepted_loss))
        print_note("warning: %.0f bytes of %.0f were stored", stored, sent);
}

using take_function = void (*)(round&, const load&, samples&);

void run_round(const setup& s, subject who, take_function take, const load& l, samples& into) {
    const scratch_directory directory(s.scratch);
    child_process process = start_subject(s, who, l, directory.path());
    round r{.who = who,
            .pid = process.pid(),
            .directory = directory.path(),
            .producer = connect_producer(directory.path()),
            .packet = event_packet(l.payload_size),
            .record_size = event_head_size(l.payload_size) + l.payload_size};
    const bool reports = who == subject::daemon || who == subject::gathered;
    std::optional<report_remover> remover;
    if (reports) {
        std::filesystem::create_directory(directory.path() + "/output");
        remover.emplace(directory.path());
    }
    send_events(r, warm_up_events);
    take(r, l, into);
    stop(process);  // the daemon waits for the last compactor
    const size_t reported = reports ? remover->finish() : 0;
    if (who == subject::daemon && l.compress == compression::off) check_stored_bytes(r, reported);
}

void print_ratios(const samples& a, const samples& b, const samples& f, const samples& daemon,
                  double cpu_goal) {
    print_row("events/s, kivd : A", ratios(daemon.events_per_second, a.events_per_second), "x");
    print_row("events/s, kivd : B", ratios(daemon.events_per_second, b.events_per_second), "x");
    print_row("events/s, kivd : F", ratios(daemon.events_per_second, f.events_per_second), "x",
              {bound::at_least, 0.9});
    print_row("events/s, kivd between reports : B",
              ratios(daemon.between_reports, b.between_reports), "x");
    print_row("CPU an event, kivd : A", ratios(daemon.cpu_us, a.cpu_us), "x",
              {bound::at_most, cpu_goal});
    print_row("CPU an event, kivd : B", ratios(daemon.cpu_us, b.cpu_us), "x");
    print_row("CPU an event, kivd : F", ratios(daemon.cpu_us, f.cpu_us), "x",
              {bound::at_most, 1.15});
}

void print_rows(const samples& a, const samples& b, const samples& f, const samples& daemon,
                double cpu_goal) {
    print_row("A: one packet a wait, 2 writes and a seek", a.events_per_second, "ev/s");
    print_row("B: batches, one writev a packet", b.events_per_second, "ev/s");
    print_row("F: batches, one writev a batch, reports", f.events_per_second, "ev/s");
    print_row("kivd", daemon.events_per_second, "ev/s");
    print_row("kivd, between reports", daemon.between_reports, "ev/s");
    print_row("CPU an event, A", a.cpu_us, "us");
    print_row("CPU an event, B", b.cpu_us, "us");
    print_row("CPU an event, F without its children", f.cpu_us, "us");
    print_row("CPU an event, kivd without compactors", daemon.cpu_us, "us");
    print_row("CPU an event, kivd with compactors", daemon.family_cpu_us, "us");
    print_ratios(a, b, f, daemon, cpu_goal);
    print_row("system calls an event, full queue, A", a.system_calls, "");
    print_row("system calls an event, full queue, B", b.system_calls, "");
    print_row("system calls an event, full queue, F", f.system_calls, "");
    print_row("system calls an event, full queue, kivd", daemon.system_calls, "",
              {bound::at_most, 0.35});
    print_row("system calls an event, alone, A", a.lone_system_calls, "");
    print_row("system calls an event, alone, kivd", daemon.lone_system_calls, "",
              {bound::at_most, 3});
}

void measure_load(const setup& s, const load& l, double cpu_goal) {
    samples a;
    samples b;
    samples f;
    samples daemon;
    const auto run_all = [&](take_function take, unsigned rounds) {
        for (unsigned i = 0; i < rounds; ++i) {
            run_round(s, subject::one_a_wait, take, l, a);
            run_round(s, subject::batched, take, l, b);
            run_round(s, subject::gathered, take, l, f);
            run_round(s, subject::daemon, take, l, daemon);
        }
    };
    run_all(take_rates, amount(s, 9, 3));
    run_all(take_bursts, amount(s, 5, 1));
    run_all(take_children_cpu, amount(s, 3, 1));
    run_all(take_system_calls, amount(s, 3, 1));
    print_rows(a, b, f, daemon, cpu_goal);
}

void measure_compressing(const setup& s, load l) {
    l.compress = compression::on;
    samples f;
    samples daemon;
    for (unsigned i = 0; i < amount(s, 9, 3); ++i) {
        run_round(s, subject::gathered, take_rates, l, f);
        run_round(s, subject::daemon, take_rates, l, daemon);
    }
    print_row("events/s, F compressing", f.events_per_second, "ev/s");
    print_row("events/s, kivd compressing", daemon.events_per_second, "ev/s");
    print_row("events/s, compressing, kivd : F",
              ratios(daemon.events_per_second, f.events_per_second), "x", {bound::at_least, 0.95});
}

void measure_size(const setup& s, const char* title, const load& l, double cpu_goal) {
    print_section(title);
    measure_load(s, l, cpu_goal);
    measure_compressing(s, l);
}

}  // namespace

void measure_events(const setup& s) {
    measure_size(s, "Events of 64 bytes",
                 {.payload_size = 64,
                  .compress = compression::off,
                  .events = amount(s, 200'000, 40'000),
                  .lone_events = amount(s, 2000, 500),
                  .bursts = amount(s, 40, 10)},
                 0.4);
}

void measure_large_events(const setup& s) {
    measure_size(s, "Events of 512 bytes",
                 {.payload_size = 512,
                  .compress = compression::off,
                  .events = amount(s, 100'000, 20'000),
                  .lone_events = amount(s, 1000, 250),
                  .bursts = amount(s, 80, 20)},
                 0.45);
    measure_size(s, "Events of 4,096 bytes",
                 {.payload_size = 4096,
                  .compress = compression::off,
                  .events = amount(s, 20'000, 5'000),
                  .lone_events = amount(s, 500, 100),
                  .bursts = amount(s, 20, 5)},
                 0.7);
}

}  // namespace kivd::bench
