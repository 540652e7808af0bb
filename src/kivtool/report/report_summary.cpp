#include "kivtool/report/report_summary.h"

#include <algorithm>
#include <cstdio>
#include <functional>
#include <iomanip>
#include <span>
#include <string_view>
#include <tuple>
#include <vector>

#include "kivtool/report/known_payload.h"
#include "kivtool/report/report_tally.h"
#include "kivtool/report/time_text.h"
#include "toolkit/text_escape.h"

namespace kivd {
namespace {

constexpr size_t event_rows = 10;
constexpr size_t counter_rows = 10;
constexpr size_t message_rows = 10;

// A probe and what is kept for it.
template <class value>
struct table_row {
    std::string_view package, name;
    const value* kept;

    [[nodiscard]] std::string probe() const { return printable(package) + " " + printable(name); }
};

// The rows of a table by package and name.
template <class value>
std::vector<table_row<value>> rows_of(const probe_table<value>& table) {
    std::vector<table_row<value>> rows;
    rows.reserve(table.size());
    table.for_each([&rows](auto package, auto name, const value& kept) {
        rows.push_back({package, name, &kept});
    });
    std::ranges::sort(rows, [](const auto& a, const auto& b) {
        return std::tie(a.package, a.name) < std::tie(b.package, b.name);
    });
    return rows;
}

// Those with the largest `member` first.
template <class value>
void sort_by(std::vector<table_row<value>>& rows, auto member) {
    std::ranges::stable_sort(rows, std::greater{},
                             [member](const auto& row) { return row.kept->*member; });
}

std::string offset_text(int32_t seconds) {
    char text[32];
    const int64_t minutes = std::abs(static_cast<int64_t>(seconds)) / 60;
    snprintf(text, sizeof text, "UTC%c%02d:%02d", seconds < 0 ? '-' : '+',
             static_cast<int>(minutes / 60), static_cast<int>(minutes % 60));
    return text;
}

std::string duration_text(int64_t first_ms, int64_t last_ms) {
    // Unsigned, since forged times may be too far apart for a signed number.
    const uint64_t seconds =
        (static_cast<uint64_t>(last_ms) - static_cast<uint64_t>(first_ms)) / 1000;
    if (seconds < 60) return std::to_string(seconds) + " s";
    if (seconds < 3600) return std::to_string(seconds / 60) + " min";
    if (seconds < 86400) {
        return std::to_string(seconds / 3600) + " h " + std::to_string(seconds / 60 % 60) + " min";
    }
    return std::to_string(seconds / 86400) + " d " + std::to_string(seconds / 3600 % 24) + " h";
}

// One line; nothing when `text` is empty.
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

void print_contents(std::ostream& out, const report_tally& tally) {
    const time_span& span = tally.span;
    if (!span.empty()) {
        print_fact(out, "time (UTC)",
                   time_text(span.first) + " to " + time_text(span.last) + ", " +
                       duration_text(span.first, span.last));
    }
    print_fact(out, "contents",
               std::to_string(tally.events) + " events, " + std::to_string(tally.counters) +
                   " counters, " + std::to_string(tally.statics) + " static values");
    print_fact(
        out, "size",
        std::to_string(tally.data_size) + " bytes" +
            (tally.file_size > 0 ? ", " + std::to_string(tally.file_size) + " compressed" : ""));
    if (tally.unlisted > 0) {
        print_fact(out, "note",
                   std::to_string(tally.unlisted) + " records are of probes beyond the first " +
                       std::to_string(max_table_probes) + " and are not listed");
    }
}

// The heading of a list that shows `shown` entries: "events (10 of 14)".
void print_head(std::ostream& out, const char* what, size_t shown, size_t all) {
    out << "\n  " << what;
    if (shown < all) out << " (" << shown << " of " << all << ")";
    out << '\n';
}

void print_events(std::ostream& out, const report_tally& tally) {
    auto rows = rows_of(tally.by_event);
    if (rows.empty()) return;
    sort_by(rows, &event_tally::count);
    const size_t shown = std::min(rows.size(), event_rows);
    print_head(out, "events by probe: number, probe, payload, latest", shown, rows.size());
    for (const auto& row : std::span(rows).first(shown)) {
        out << std::right << std::setw(12) << row.kept->count << "  " << std::left << std::setw(40)
            << row.probe() << "  " << row.kept->payload_size << " bytes, "
            << time_text(row.kept->last) << '\n';
    }
}

// The latest events whose payload is a known message, in the order of the file.
void print_messages(std::ostream& out, const report_tally& tally) {
    std::vector<std::string> lines;
    const auto& messages = tally.messages;
    for (auto event = messages.rbegin(); event != messages.rend(); ++event) {
        const std::string text = known_payload_text(*event);
        if (!text.empty()) lines.push_back(time_text(event->timestamp()) + "  " + printable(text));
        if (lines.size() == message_rows) break;
    }
    if (lines.empty()) return;
    out << "\n  latest messages: time, message\n";
    for (auto line = lines.rbegin(); line != lines.rend(); ++line) out << "    " << *line << '\n';
}

using counter_list = std::vector<table_row<latest_counter>>;

void print_counter_list(std::ostream& out, const char* what, const counter_list& counters,
                        size_t shown) {
    print_head(out, what, shown, counters.size());
    for (const auto& row : std::span(counters).first(shown)) {
        out << std::right << std::setw(22) << row.kept->value << "  " << std::left << std::setw(40)
            << row.probe() << "  " << time_text(row.kept->time) << '\n';
    }
}

void print_counters(std::ostream& out, const report_tally& tally) {
    counter_list counters = rows_of(tally.by_counter);
    if (counters.empty()) return;
    sort_by(counters, &latest_counter::value);
    if (counters.size() <= counter_rows) {
        print_counter_list(out, "counters: value, probe, latest change", counters, counters.size());
        return;
    }
    print_counter_list(out, "largest counters: value, probe, latest change", counters,
                       counter_rows / 2);
    sort_by(counters, &latest_counter::time);
    print_counter_list(out, "latest counters: value, probe, latest change", counters,
                       counter_rows / 2);
}

// In the order in which they came.
void print_static_data(std::ostream& out, const report_tally& tally) {
    auto rows = rows_of(tally.by_static);
    if (rows.empty()) return;
    std::ranges::sort(rows, std::less{}, [](const auto& row) { return row.kept->rank; });
    print_head(out, "static data: probe, value", 0, 0);
    for (const auto& row : rows) {
        out << "    " << std::left << std::setw(40) << row.probe() << "  " << row.kept->value
            << '\n';
    }
}

void print_tables(std::ostream& out, const report_tally& tally) {
    print_contents(out, tally);
    print_events(out, tally);
    print_messages(out, tally);
    print_counters(out, tally);
    print_static_data(out, tally);
}

class summary_view : public report_view {
 public:
    explicit summary_view(std::ostream& out) : out_(out) {}

    void start_file(const std::string& path) override {
        path_ = path;
        file_ = {};
    }

    void add(const report_record& record) override { file_.add(record); }

    std::string finish_file(const report_reader& file) override {
        file_.data_size = file.data_size();
        if (file.is_gzip()) file_.file_size = file.file_size();
        if (files_++ > 0) out_ << '\n';
        out_ << printable(path_) << '\n';
        if (!file_.has_header) print_fact(out_, "note", "no header, as in diagnostics files");
        print_identity(out_, file_.header);
        print_tables(out_, file_);
        total_.add(file_);
        return "";
    }

    void finish() override {
        if (files_ < 2) return;
        out_ << "\ntotal of " << files_ << " files\n";
        print_tables(out_, total_);
    }

 private:
    std::ostream& out_;
    std::string path_;
    report_tally file_;
    report_tally total_;
    size_t files_ = 0;
};

}  // namespace

std::unique_ptr<report_view> make_summary_view(std::ostream& out) {
    return std::make_unique<summary_view>(out);
}

}  // namespace kivd
