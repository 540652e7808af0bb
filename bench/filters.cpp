// What asking a probe filter costs among few and among many entries, and what it takes from the
// daemon's rate of events.
#include "config/filters.h"

#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <random>
#include <span>
#include <string>
#include <tuple>

#include "bench/configuration.h"
#include "bench/load.h"
#include "bench/measure.h"
#include "bench/plain_file.h"
#include "bench/sections.h"
#include "config/config_parts.h"

namespace kivd::bench {

namespace {

using kiv::config::Filter;

constexpr unsigned few = 100;
constexpr unsigned many = 10'000;
constexpr unsigned most = 19'900;
constexpr unsigned asked_probes = 65'536;
constexpr size_t payload_size = 64;
constexpr useconds_t settle_us = 5'000;

bool by_texts(const probe& a, const probe& b) {
    return std::tie(a.package, a.name) < std::tie(b.package, b.name);
}

// As many of `listed` as of others, which are another name of a listed package or of no such
// package, in an order that no cache can foresee.
std::vector<probe> choose_asked(const std::vector<probe>& listed) {
    std::mt19937 random(1);
    std::vector<probe> asked;
    for (unsigned i = 0; i < asked_probes; ++i) {
        probe each = listed[random() % listed.size()];
        if (i % 4 == 1) each.name += "_total";
        if (i % 4 == 3) each.package += ".beta";
        asked.push_back(std::move(each));
    }
    return asked;
}

// The time of one call of `match`, in ns.
double time_matches(const std::vector<probe>& asked, unsigned calls, auto match) {
    const auto run = [&](unsigned count) {
        unsigned found = 0;
        for (unsigned i = 0; i < count; ++i) found += match(asked[i % asked.size()]) ? 1 : 0;
        return found;
    };
    const unsigned warm_up = asked_probes;
    if (run(warm_up) != warm_up / 2) give_up("the filter keeps other probes than it should");
    const int64_t start = now_ns();
    (void)run(calls);
    return static_cast<double>(now_ns() - start) / calls;
}

double time_filter(Filter::Type type, const std::vector<probe>& listed,
                   const std::vector<probe>& asked, unsigned calls) {
    const std::string payload = pack_event_filter(type, listed);
    retire_config_parts({});
    store_config_part("kivd", "FilterConfig",
                      {reinterpret_cast<const uint8_t*>(payload.data()), payload.size()});
    apply_filter_config();
    return time_matches(asked, calls, [](const probe& each) {
        return filter_match(filter_kind::events, each.package.c_str(), each.name.c_str());
    });
}

struct match_times {
    std::vector<double> plain_ns;
    std::vector<double> include_ns;
    std::vector<double> exclude_ns;
};

void run_match_round(const setup& s, unsigned entries, match_times& into) {
    const scratch_directory directory(s.scratch);
    double times[3];
    run_in_child(times, [&](std::span<double> figures) {
        if (chdir(directory.path().c_str()) == -1) give_up("chdir failed");
        std::filesystem::create_directory("private");
        load_config_list();
        (void)load_filters();
        const unsigned calls = amount(s, 1'000'000, 200'000);
        std::vector<probe> listed = make_probes(entries);
        const std::vector<probe> asked = choose_asked(listed);
        figures[1] = time_filter(Filter::INCLUDE, listed, asked, calls);
        figures[2] = time_filter(Filter::EXCLUDE, listed, asked, calls);
        std::ranges::sort(listed, by_texts);
        figures[0] = time_matches(asked, calls, [&listed](const probe& each) {
            return std::ranges::binary_search(listed, each, by_texts);
        });
    });
    into.plain_ns.push_back(times[0]);
    into.include_ns.push_back(times[1]);
    into.exclude_ns.push_back(times[2]);
}

void measure_match(const setup& s, unsigned entries, const char* title, goal wanted) {
    match_times times;
    for (unsigned i = 0; i < amount(s, 9, 3); ++i) run_match_round(s, entries, times);
    print_note("%s entries, half of the probes asked for among them", title);
    print_row("binary search in a vector of strings", times.plain_ns, "ns");
    print_row("filter_match, INCLUDE", times.include_ns, "ns", wanted);
    print_row("filter_match, EXCLUDE", times.exclude_ns, "ns", wanted);
    print_row("INCLUDE : binary search", ratios(times.include_ns, times.plain_ns), "x");
    print_row("EXCLUDE : binary search", ratios(times.exclude_ns, times.plain_ns), "x");
}

struct event_costs {
    std::vector<double> events_per_second;
    std::vector<double> cpu_us;
};

// Probes that the filter keeps.
std::vector<std::string> make_event_packets() {
    const std::string payload(payload_size, 'x');
    std::vector<std::string> packets;
    for (const probe& each : make_probes(many))
        packets.push_back("EV " + each.package + " " + each.name + "_total " + payload);
    std::ranges::shuffle(packets, std::mt19937(1));
    return packets;
}

// `config` is the configuration file that the daemon finds at its start; empty for none.
void run_event_round(const setup& s, const std::string& config,
                     const std::vector<std::string>& packets, event_costs& into) {
    const scratch_directory directory(s.scratch);
    std::filesystem::create_directory(directory.path() + "/input");
    if (!config.empty()) write_file(directory.path() + "/input/config", config);
    daemon_process daemon = start_daemon(s, directory.path(), compression::off);
    if (ask(connect_control(directory.path()).get(), "IA") != "1") give_up("no answer to IA");
    if (!config.empty() && !std::filesystem::exists(directory.path() + "/private/filters.txt"))
        give_up("the daemon does not use the filter");
    const unique_fd producer = connect_producer(directory.path());
    const auto send = [&](unsigned count) {
        for (unsigned i = 0; i < count; ++i)
            send_packet(producer.get(), packets[i % packets.size()]);
        wait_until_taken(producer.get());
        (void)usleep(settle_us);
    };
    send(many);
    const unsigned events = amount(s, 200'000, 40'000);
    const int64_t cpu_before = process_cpu_ns(daemon.pid());
    const int64_t start = now_ns();
    send(events);
    const double seconds = static_cast<double>(now_ns() - start) / 1e9 - settle_us / 1e6;
    const int64_t cpu = process_cpu_ns(daemon.pid()) - cpu_before;
    into.events_per_second.push_back(events / seconds);
    into.cpu_us.push_back(static_cast<double>(cpu) / 1e3 / events);
    stop(daemon);
}

void measure_filtered_events(const setup& s) {
    const std::string config = make_config_file(
        compress(make_filter_package(pack_event_filter(Filter::EXCLUDE, make_probes(many)))), "");
    const std::vector<std::string> packets = make_event_packets();
    event_costs none;
    event_costs filtered;
    for (unsigned i = 0; i < amount(s, 7, 3); ++i) {
        run_event_round(s, "", packets, none);
        run_event_round(s, config, packets, filtered);
    }
    print_note("events of 64 bytes from 10,000 probes, all kept by an EXCLUDE filter of 10,000");
    print_row("events/s, no filter", none.events_per_second, "ev/s");
    print_row("events/s, filter", filtered.events_per_second, "ev/s");
    print_row("events/s, filter : none", ratios(filtered.events_per_second, none.events_per_second),
              "x");
    print_row("CPU an event, no filter", none.cpu_us, "us");
    print_row("CPU an event, filter", filtered.cpu_us, "us");
    print_row("CPU an event, filter : none", ratios(filtered.cpu_us, none.cpu_us), "x");
}

}  // namespace

void measure_filters(const setup& s) {
    print_section("Filters");
    measure_match(s, few, "100", {});
    measure_match(s, many, "10,000", {bound::at_most, 500});
    measure_match(s, most, "19,900", {});
    measure_filtered_events(s);
}

}  // namespace kivd::bench
