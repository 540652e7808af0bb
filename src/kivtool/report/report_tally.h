// Gathers what a summary says about reports while they are read. Takes bounded memory.
#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <limits>
#include <string>
#include <string_view>

#include "kivtool/report/probe_table.h"
#include "kivtool/report/report_view.h"

namespace kivd {

struct time_span {
    int64_t first = std::numeric_limits<int64_t>::max();  // milliseconds since 1970
    int64_t last = std::numeric_limits<int64_t>::min();

    void add(int64_t time);
    void add(const time_span& other);
    [[nodiscard]] bool empty() const { return first > last; }
};

struct event_tally {
    uint64_t count = 0;
    uint64_t payload_size = 0;  // bytes
    int64_t last = std::numeric_limits<int64_t>::min();

    void add(const event_tally& other);
};

// add() keeps the later of the two.
struct latest_counter {
    int64_t value = 0;
    int64_t time = std::numeric_limits<int64_t>::min();

    void add(const latest_counter& other);
};

struct latest_static {
    std::string value;  // as it is shown
    int64_t time = std::numeric_limits<int64_t>::min();
    uint64_t rank = 0;  // in the order in which they came first

    void add(const latest_static& other);
};

struct report_tally {
    void add(const report_record& record);
    // Adds the content of another report, a later one.
    void add(const report_tally& other);

    bool has_header = false;
    kiv::Header header;  // the last one
    time_span span;
    uint64_t data_size = 0;  // bytes
    uint64_t file_size = 0;  // of gzip files
    uint64_t events = 0;
    uint64_t counters = 0;
    uint64_t statics = 0;
    uint64_t unlisted = 0;  // records whose probe found no room in the tables
    probe_table<event_tally> by_event;
    probe_table<latest_counter> by_counter;
    probe_table<latest_static> by_static;
    std::deque<kiv::Event> messages;  // the last ones that may hold a known message

 private:
    void add(const kiv::Event& event);
    void add(const kiv::Counter& counter);
    void add(const kiv::StaticData& item);
    // Counts `records` as unlisted when the table has no room for another probe.
    template <class value>
    void add(probe_table<value>& table, std::string_view package, std::string_view name,
             const value& its, uint64_t records = 1);
    void keep_message(const kiv::Event& event);
};

}  // namespace kivd
