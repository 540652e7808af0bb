#include "kivtool/report/report_tally.h"

#include <algorithm>
#include <utility>

#include "kivtool/report/known_payload.h"
#include "toolkit/text_escape.h"

namespace kivd {
namespace {
constexpr size_t shown_value = 60;    // characters
constexpr size_t kept_messages = 40;  // more than are shown, since some may not decode
}  // namespace

void time_span::add(int64_t time) {
    first = std::min(first, time);
    last = std::max(last, time);
}

void time_span::add(const time_span& other) {
    first = std::min(first, other.first);
    last = std::max(last, other.last);
}

void event_tally::add(const event_tally& other) {
    count += other.count;
    payload_size += other.payload_size;
    last = std::max(last, other.last);
}

void latest_counter::add(const latest_counter& other) {
    if (other.time >= time) *this = other;
}

void latest_static::add(const latest_static& other) {
    if (other.time < time) return;
    const uint64_t first_rank = rank == 0 ? other.rank : rank;
    *this = other;
    rank = first_rank;
}

template <class value>
void report_tally::add(probe_table<value>& table, std::string_view package, std::string_view name,
                       const value& its, uint64_t records) {
    if (value* const kept = table.find_or_add(package, name)) {
        kept->add(its);
    } else {
        unlisted += records;
    }
}

void report_tally::add(const report_record& record) {
    switch (record.field->number()) {
        case kiv::Report::kHeaderFieldNumber:
            has_header = true;
            header = get<kiv::Header>(record);
            return;
        case kiv::Report::kEventsFieldNumber:
            return add(get<kiv::Event>(record));
        case kiv::Report::kCountersFieldNumber:
            return add(get<kiv::Counter>(record));
        case kiv::Report::kStaticsFieldNumber:
            return add(get<kiv::StaticData>(record));
        default:
            return;
    }
}

void report_tally::add(const kiv::Event& event) {
    ++events;
    span.add(event.timestamp());
    if (is_of_known_kind(event)) keep_message(event);
    add(by_event, event.package(), event.name(), {1, event.payload().size(), event.timestamp()});
}

void report_tally::add(const kiv::Counter& counter) {
    ++counters;
    span.add(counter.to_timestamp());
    add(by_counter, counter.package(), counter.name(), {counter.value(), counter.to_timestamp()});
}

void report_tally::add(const kiv::StaticData& item) {
    ++statics;
    span.add(item.timestamp());
    add(by_static, item.package(), item.name(),
        {printable(item.value(), shown_value), item.timestamp(), statics});
}

void report_tally::keep_message(const kiv::Event& event) {
    if (messages.size() < kept_messages) {
        messages.push_back(event);
        return;
    }
    kiv::Event used_again;
    used_again.Swap(&messages.front());
    messages.pop_front();
    used_again = event;
    messages.push_back(std::move(used_again));
}

void report_tally::add(const report_tally& other) {
    span.add(other.span);
    data_size += other.data_size;
    file_size += other.file_size;
    events += other.events;
    counters += other.counters;
    unlisted += other.unlisted;
    other.by_event.for_each([this](auto package, auto name, const event_tally& its) {
        add(by_event, package, name, its, its.count);
    });
    other.by_counter.for_each([this](auto package, auto name, const latest_counter& its) {
        add(by_counter, package, name, its);
    });
    other.by_static.for_each([this](auto package, auto name, latest_static its) {
        its.rank += statics;
        add(by_static, package, name, its);
    });
    statics += other.statics;
    for (const kiv::Event& event : other.messages) keep_message(event);
}

}  // namespace kivd
