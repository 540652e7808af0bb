#include "tools/report_summary.h"

#include <algorithm>
#include <cstdio>
#include <ctime>
#include <iomanip>
#include <limits>
#include <map>
#include <utility>
#include <vector>

#include "tools/known_payload.h"
#include "tools/text_escape.h"

namespace kivd {
namespace {

constexpr size_t event_rows = 10;
constexpr size_t counter_rows = 10;
constexpr size_t message_rows = 10;
constexpr size_t value_characters = 60;

struct event_kind {
    std::string probe;
    size_t count = 0;
    size_t payload_size = 0;
    int64_t last = std::numeric_limits<int64_t>::min();
};

struct time_span {
    int64_t first = std::numeric_limits<int64_t>::max();
    int64_t last = std::numeric_limits<int64_t>::min();

    void add(int64_t time) {
        first = std::min(first, time);
        last = std::max(last, time);
    }
    [[nodiscard]] bool empty() const { return first > last; }
};

template <class part>
std::string probe_name(const part& probe) {
    return printable(probe.package()) + " " + printable(probe.name());
}

std::string time_text(int64_t ms) {
    constexpr int64_t end_of_year_9999_ms = 253402300800000;
    if (ms < 0 || ms >= end_of_year_9999_ms) return std::to_string(ms) + " ms";
    const auto seconds = static_cast<time_t>(ms / 1000);
    tm utc{};
    char text[32];
    gmtime_r(&seconds, &utc);
    strftime(text, sizeof text, "%Y-%m-%d %H:%M:%S", &utc);
    return text;
}

std::string offset_text(int32_t seconds) {
    char text[32];
    const int64_t minutes = std::abs(static_cast<int64_t>(seconds)) / 60;
    snprintf(text, sizeof text, "UTC%c%02d:%02d", seconds < 0 ? '-' : '+',
             static_cast<int>(minutes / 60), static_cast<int>(minutes % 60));
    return text;
}

std::string duration_text(int64_t first_ms, int64_t last_ms) {
    // Unsigned, since two hostile times can be further apart than a signed number holds.
    const uint64_t seconds =
        (static_cast<uint64_t>(last_ms) - static_cast<uint64_t>(first_ms)) / 1000;
    if (seconds < 60) return std::to_string(seconds) + " s";
    if (seconds < 3600) return std::to_string(seconds / 60) + " min";
    if (seconds < 86400) {
        return std::to_string(seconds / 3600) + " h " + std::to_string(seconds / 60 % 60) + " min";
    }
    return std::to_string(seconds / 86400) + " d " + std::to_string(seconds / 3600 % 24) + " h";
}

// A line of what is known about the sender; nothing when it is not known.
void print_fact(std::ostream& out, const char* what, const std::string& text) {
    if (text.empty()) return;
    out << "  " << std::left << std::setw(15) << what << text << '\n';
}

void print_identity(std::ostream& out, const kiv::Header& header) {
    std::string groups;
    for (const std::string& id : header.group_id()) {
        groups += (groups.empty() ? "" : ", ") + printable(id);
    }
    print_fact(out, "product", printable(header.product_id()));
    print_fact(out, "software", printable(header.software_version()));
    print_fact(out, "variant", printable(header.software_variant()));
    print_fact(out, "build type", printable(header.build_type()));
    print_fact(out, "device id", printable(header.device_id()));
    print_fact(out, "serial number", printable(header.serial_number()));
    print_fact(out, "IMEI", printable(header.device_imei()));
    print_fact(out, "CDF id", printable(header.cdf_id()));
    print_fact(out, "groups", groups);
    print_fact(out, "configuration", printable(header.config_checksum()));
    if (header.has_timezone()) print_fact(out, "local time", offset_text(header.timezone()));
}

time_span span_of(const kiv::Report& report) {
    time_span span;
    for (const kiv::Event& event : report.events()) span.add(event.timestamp());
    for (const kiv::Counter& counter : report.counters()) span.add(counter.to_timestamp());
    for (const kiv::StaticData& item : report.statics()) span.add(item.timestamp());
    return span;
}

void print_contents(std::ostream& out, const report_file& file) {
    const kiv::Report& report = file.report;
    const time_span span = span_of(report);
    if (!span.empty()) {
        print_fact(out, "time (UTC)",
                   time_text(span.first) + " to " + time_text(span.last) + ", " +
                       duration_text(span.first, span.last));
    }
    print_fact(out, "contents",
               std::to_string(report.events_size()) + " events, " +
                   std::to_string(report.counters_size()) + " counters, " +
                   std::to_string(report.statics_size()) + " static values");
    print_fact(out, "size",
               std::to_string(file.data_size) + " bytes" +
                   (file.is_gzip ? ", " + std::to_string(file.file_size) + " compressed" : ""));
}

std::vector<event_kind> events_by_kind(const kiv::Report& report) {
    std::map<std::pair<std::string, std::string>, event_kind> found;
    for (const kiv::Event& event : report.events()) {
        event_kind& kind = found[{event.package(), event.name()}];
        if (kind.count++ == 0) kind.probe = probe_name(event);
        kind.payload_size += event.payload().size();
        kind.last = std::max(kind.last, event.timestamp());
    }
    std::vector<event_kind> kinds;
    kinds.reserve(found.size());
    for (auto& [id, kind] : found) kinds.push_back(std::move(kind));
    std::ranges::stable_sort(kinds, std::greater{}, &event_kind::count);
    return kinds;
}

// "events (10 of 14)", as the head of a list that shows `shown`.
void print_head(std::ostream& out, const char* what, size_t shown, size_t all) {
    out << "\n  " << what;
    if (shown < all) out << " (" << shown << " of " << all << ")";
    out << '\n';
}

void print_events(std::ostream& out, const kiv::Report& report) {
    const std::vector<event_kind> kinds = events_by_kind(report);
    if (kinds.empty()) return;
    const size_t shown = std::min(kinds.size(), event_rows);
    print_head(out, "events by probe: number, probe, payload, latest", shown, kinds.size());
    for (size_t i = 0; i < shown; ++i) {
        out << std::right << std::setw(12) << kinds[i].count << "  " << std::left << std::setw(40)
            << kinds[i].probe << "  " << kinds[i].payload_size << " bytes, "
            << time_text(kinds[i].last) << '\n';
    }
}

// The latest events whose payload is a known message, in the order of the file.
void print_messages(std::ostream& out, const kiv::Report& report) {
    std::vector<std::string> lines;
    for (int i = report.events_size() - 1; i >= 0 && lines.size() < message_rows; --i) {
        const kiv::Event& event = report.events(i);
        const std::string text = known_payload_text(event);
        if (!text.empty()) lines.push_back(time_text(event.timestamp()) + "  " + printable(text));
    }
    if (lines.empty()) return;
    out << "\n  latest messages: time, message\n";
    for (auto line = lines.rbegin(); line != lines.rend(); ++line) out << "    " << *line << '\n';
}

using counter_list = std::vector<const kiv::Counter*>;

void print_counter_list(std::ostream& out, const char* what, const counter_list& counters,
                        size_t shown) {
    print_head(out, what, shown, counters.size());
    for (size_t i = 0; i < shown; ++i) {
        out << std::right << std::setw(22) << counters[i]->value() << "  " << std::left
            << std::setw(40) << probe_name(*counters[i]) << "  "
            << time_text(counters[i]->to_timestamp()) << '\n';
    }
}

void print_counters(std::ostream& out, const kiv::Report& report) {
    counter_list counters;
    counters.reserve(static_cast<size_t>(report.counters_size()));
    for (const kiv::Counter& counter : report.counters()) counters.push_back(&counter);
    if (counters.empty()) return;
    std::ranges::stable_sort(counters, std::greater{}, &kiv::Counter::value);
    if (counters.size() <= counter_rows) {
        print_counter_list(out, "counters: value, probe, latest change", counters, counters.size());
        return;
    }
    print_counter_list(out, "largest counters: value, probe, latest change", counters,
                       counter_rows / 2);
    std::ranges::stable_sort(counters, std::greater{}, &kiv::Counter::to_timestamp);
    print_counter_list(out, "latest counters: value, probe, latest change", counters,
                       counter_rows / 2);
}

void print_static_data(std::ostream& out, const kiv::Report& report) {
    if (report.statics_size() == 0) return;
    print_head(out, "static data: probe, value", 0, 0);
    for (const kiv::StaticData& item : report.statics()) {
        out << "    " << std::left << std::setw(40) << probe_name(item) << "  "
            << printable(item.value(), value_characters) << '\n';
    }
}

}  // namespace

void print_summary(std::ostream& out, const std::string& path, const report_file& file) {
    out << printable(path) << '\n';
    if (!file.report.has_header()) print_fact(out, "note", "no header, as in diagnostics files");
    print_identity(out, file.report.header());
    print_contents(out, file);
    print_events(out, file.report);
    print_messages(out, file.report);
    print_counters(out, file.report);
    print_static_data(out, file.report);
}

}  // namespace kivd
