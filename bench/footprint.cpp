// What the daemon takes while nothing happens, and how fast it comes and goes.
#include <unistd.h>

#include "bench/load.h"
#include "bench/measure.h"
#include "bench/sections.h"

namespace kivd::bench {

namespace {

constexpr unsigned stored_counters = 10'000;
constexpr useconds_t settle_us = 300'000;

void measure_idle(const setup& s) {
    std::vector<double> kilobytes;
    std::vector<double> resident;
    std::vector<double> wake_ups;
    for (unsigned i = 0; i < amount(s, 3, 1); ++i) {
        const scratch_directory directory(s.scratch);
        daemon_process daemon = start_daemon(s, directory.path(), compression::on);
        (void)ask(connect_control(directory.path()).get(), "IA");
        (void)usleep(settle_us);
        const pid_t pid = daemon.pid();
        kilobytes.push_back(static_cast<double>(private_dirty_bytes(pid)) / 1024);
        resident.push_back(static_cast<double>(resident_bytes(pid)) / 1024);
        const int64_t before = voluntary_switches(pid);
        (void)sleep(amount(s, 5, 2));
        wake_ups.push_back(static_cast<double>(voluntary_switches(pid) - before));
        stop(daemon);
    }
    print_row("private dirty memory", kilobytes, "KiB", {bound::at_most, 300});
    print_row("resident memory", resident, "KiB", {bound::at_most, 3000});
    print_row("wake-ups in some seconds without a request", wake_ups, "", {bound::at_most, 0});
}

// Starts the daemon and gives the time to its first answer, in ms.
double start_and_ask(const setup& s, const std::string& directory, daemon_process& started) {
    const int64_t start = now_ns();
    started = start_daemon(s, directory, compression::on);
    const unique_fd control = connect_control(directory);
    (void)ask(control.get(), "IA");
    return static_cast<double>(now_ns() - start) / 1e6;
}

void measure_start_and_stop(const setup& s) {
    std::vector<double> empty_start_ms;
    for (unsigned i = 0; i < amount(s, 20, 5); ++i) {
        const scratch_directory empty(s.scratch);
        daemon_process daemon;
        empty_start_ms.push_back(start_and_ask(s, empty.path(), daemon));
        stop(daemon);
    }
    const scratch_directory directory(s.scratch);
    {
        daemon_process daemon = start_daemon(s, directory.path(), compression::on);
        touch_counters(directory.path(), stored_counters);
        stop(daemon);
    }
    std::vector<double> start_ms;
    std::vector<double> clean_stop_ms;
    std::vector<double> saving_stop_ms;
    for (unsigned i = 0; i < amount(s, 20, 5); ++i) {
        daemon_process daemon;
        start_ms.push_back(start_and_ask(s, directory.path(), daemon));
        const bool saving = i % 2 == 1;
        if (saving) touch_counters(directory.path(), 1);
        (void)usleep(settle_us / 10);
        const double taken = static_cast<double>(stop(daemon)) / 1e6;
        (saving ? saving_stop_ms : clean_stop_ms).push_back(taken);
    }
    print_row("start to the first answer, nothing stored", empty_start_ms, "ms",
              {bound::at_most, 3});
    print_row("start to the first answer, 10,000 counters stored", start_ms, "ms",
              {bound::at_most, 25});
    print_row("SIGTERM to the end, nothing to save", clean_stop_ms, "ms", {bound::at_most, 20});
    print_row("SIGTERM to the end, 10,000 counters to save", saving_stop_ms, "ms",
              {bound::at_most, 20});
}

}  // namespace

void measure_footprint(const setup& s) {
    print_section("At rest, start and stop");
    measure_idle(s);
    measure_start_and_stop(s);
}

}  // namespace kivd::bench
