// How long the main thread is busy with a flush, and with a save against plain stdio.
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <filesystem>

#include "bench/load.h"
#include "bench/measure.h"
#include "bench/plain_file.h"
#include "bench/sections.h"

namespace kivd::bench {

namespace {

constexpr unsigned flushed_counters = 20'000;
constexpr unsigned saved_counters = 20'000;
constexpr size_t payload_size = 512;
constexpr size_t event_file_size = 400'000;  // just below the size that starts a report by itself
constexpr useconds_t settle_us = 5'000;
constexpr int64_t report_limit_ns = 10'000'000'000;

void fill_event_file(const std::string& directory) {
    const unique_fd producer = connect_producer(directory);
    const std::string packet = event_packet(payload_size);
    const size_t record = event_head_size(payload_size) + payload_size;
    for (size_t size = 0; size + record < event_file_size; size += record)
        send_packet(producer.get(), packet);
    wait_until_taken(producer.get());
}

void take_report(const std::string& directory) {
    const std::string report = directory + "/output/kiv_1";
    const int64_t deadline = now_ns() + report_limit_ns;
    std::error_code error;
    while (!std::filesystem::remove(report, error)) {
        if (now_ns() > deadline) give_up("no report came of a flush");
        (void)usleep(1000);
    }
    (void)usleep(settle_us);  // the compactor ends
}

struct flush_times {
    std::vector<double> elapsed_ms;
    std::vector<double> cpu_ms;
};

void run_flush(const setup& s, compression compress, unsigned counters, flush_times& into) {
    const scratch_directory directory(s.scratch);
    daemon_process daemon = start_daemon(s, directory.path(), compress);
    const unique_fd control = connect_control(directory.path());
    const pid_t pid = daemon.pid();
    for (unsigned i = 0; i < amount(s, 20, 5) + 1; ++i) {
        touch_counters(directory.path(), counters);
        fill_event_file(directory.path());
        (void)ask(control.get(), "IA");
        (void)usleep(settle_us);
        const int64_t cpu_before = main_thread_cpu_ns(pid);
        const int64_t start = now_ns();
        order(control.get(), "FL");
        (void)ask(control.get(), "IA");
        const int64_t elapsed = now_ns() - start;
        take_report(directory.path());
        if (i == 0) continue;  // the first one meets cold caches and an empty heap
        into.elapsed_ms.push_back(static_cast<double>(elapsed) / 1e6);
        into.cpu_ms.push_back(static_cast<double>(main_thread_cpu_ns(pid) - cpu_before) / 1e6);
    }
    stop(daemon);
}

struct record {
    std::string package;
    std::string name;
    long long from;
    long long to;
    long long value;
};

std::vector<record> read_records(const std::string& path) {
    const std::string bytes = read_file(path);
    std::vector<record> records;
    size_t at = 0;
    const auto field = [&] {
        std::string text = bytes.c_str() + at;
        at += text.size() + 1;
        return text;
    };
    while (at < bytes.size()) {
        record r;
        r.package = field();
        r.name = field();
        r.from = atoll(field().c_str());
        r.to = atoll(field().c_str());
        r.value = atoll(field().c_str());
        at += 2;  // the record's own NUL and the line feed
        records.push_back(std::move(r));
    }
    return records;
}

// What somebody would write who has not measured yet.
void save_plainly(const std::vector<record>& records, const std::string& path) {
    const std::string temporary = path + "_";
    FILE* const file = fopen(temporary.c_str(), "wbe");
    if (file == nullptr) give_up("%s: %s", temporary.c_str(), strerror(errno));
    for (const auto& r : records) {
        (void)fprintf(file, "%s%c%s%c%lld%c%lld%c%lld%c%c\n", r.package.c_str(), 0, r.name.c_str(),
                      0, r.from, 0, r.to, 0, r.value, 0, 0);
    }
    (void)fclose(file);
    if (rename(temporary.c_str(), path.c_str()) == -1) give_up("rename: %s", strerror(errno));
}

}  // namespace

void measure_flush(const setup& s) {
    print_section("Flush: 400 KB of events, FL to the answer of the IA behind it");
    flush_times compressed;
    flush_times stored;
    flush_times without_counters;
    run_flush(s, compression::on, flushed_counters, compressed);
    run_flush(s, compression::off, flushed_counters, stored);
    run_flush(s, compression::on, 0, without_counters);
    print_row("20,000 changed counters", compressed.elapsed_ms, "ms", {bound::at_most, 4});
    print_row("the same, CPU time of the main thread", compressed.cpu_ms, "ms");
    print_row("20,000 changed counters, reports not compressed", stored.elapsed_ms, "ms");
    print_row("the same, CPU time of the main thread", stored.cpu_ms, "ms");
    print_row("no counters", without_counters.elapsed_ms, "ms");
    print_row("the same, CPU time of the main thread", without_counters.cpu_ms, "ms");
}

void measure_save(const setup& s) {
    print_section("Save: 20,000 counters, FS to the answer of the IA behind it");
    const scratch_directory directory(s.scratch);
    daemon_process daemon = start_daemon(s, directory.path(), compression::off);
    const unique_fd control = connect_control(directory.path());
    touch_counters(directory.path(), saved_counters);
    const std::string saved = directory.path() + "/private/counters.txt";
    const std::string plain = directory.path() + "/plain_counters.txt";

    std::vector<double> daemon_ms;
    std::vector<double> plain_ms;
    std::vector<double> daemon_cpu_ms;
    std::vector<double> plain_cpu_ms;
    for (unsigned i = 0; i < amount(s, 25, 7) + 1; ++i) {
        touch_counters(directory.path(), 1);  // or there is nothing to save
        (void)ask(control.get(), "IA");
        (void)usleep(settle_us);
        int64_t cpu_before = main_thread_cpu_ns(daemon.pid());
        int64_t start = now_ns();
        order(control.get(), "FS");
        (void)ask(control.get(), "IA");
        const int64_t daemon_ns = now_ns() - start;
        (void)usleep(settle_us);
        const int64_t daemon_cpu_ns = main_thread_cpu_ns(daemon.pid()) - cpu_before;
        const std::vector<record> records = read_records(saved);
        cpu_before = main_thread_cpu_ns(getpid());
        start = now_ns();
        save_plainly(records, plain);
        const int64_t plain_ns = now_ns() - start;
        const int64_t plain_cpu_ns = main_thread_cpu_ns(getpid()) - cpu_before;
        if (records.size() != saved_counters || read_file(saved) != read_file(plain))
            give_up("the saved counters are not the expected ones");
        if (i == 0) continue;  // a file that replaces none
        daemon_ms.push_back(static_cast<double>(daemon_ns) / 1e6);
        plain_ms.push_back(static_cast<double>(plain_ns) / 1e6);
        daemon_cpu_ms.push_back(static_cast<double>(daemon_cpu_ns) / 1e6);
        plain_cpu_ms.push_back(static_cast<double>(plain_cpu_ns) / 1e6);
    }
    stop(daemon);
    print_row("fprintf for every record, rename", plain_ms, "ms");
    print_row("kivd", daemon_ms, "ms");
    print_row("kivd : fprintf", ratios(daemon_ms, plain_ms), "x", {bound::at_most, 0.35});
    print_row("CPU time, fprintf", plain_cpu_ms, "ms");
    print_row("CPU time, kivd", daemon_cpu_ms, "ms");
    print_row("CPU time, kivd : fprintf", ratios(daemon_cpu_ms, plain_cpu_ms), "x");
}

}  // namespace kivd::bench
