#include "kivtool/report/report_tally.h"

#include <algorithm>
#include <utility>

#include "kivtool/report/known_payload.h"
#include "toolkit/text_escape.h"

namespace kivd {
namespace {
constexpr size_t shown_value = 60;    // characters
constexpr size_t kept_messages = 40;  // some more than are shown: not all of them decode
}  // namespace

void time_span::add(int64_t time) {
    first = std::min(first, time);
    last = std::max(last, time);
}

void time_span::add(const time_span& other) {
    first = std::min(first, other.first);
    last = std::max(last, other.last);
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
    event_tally* const kept = by_event.find_or_add(event.package(), event.name());
    if (!kept) {
        ++unlisted;
        return;
    }
    ++kept->count;
    kept->payload_size += event.payload().size();
    kept->last = std::max(kept->last, event.timestamp());
}

void report_tally::add(const kiv::Counter& counter) {
    ++counters;
    span.add(counter.to_timestamp());
    latest_counter* const kept = by_counter.find_or_add(counter.package(), counter.name());
    if (!kept) {
        ++unlisted;
    } else if (counter.to_timestamp() >= kept->time) {
        *kept = {counter.value(), counter.to_timestamp()};
    }
}

void report_tally::add(const kiv::StaticData& item) {
    ++statics;
    span.add(item.timestamp());
    latest_static* const kept = by_static.find_or_add(item.package(), item.name());
    if (!kept) {
        ++unlisted;
    } else if (item.timestamp() >= kept->time) {
        if (kept->rank == 0) kept->rank = statics;
        kept->value = printable(item.value(), shown_value);
        kept->time = item.timestamp();
    }
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
        event_tally* const kept = by_event.find_or_add(package, name);
        if (!kept) {
            unlisted += its.count;
            return;
        }
        kept->count += its.count;
        kept->payload_size += its.payload_size;
        kept->last = std::max(kept->last, its.last);
    });
    other.by_counter.for_each([this](auto package, auto name, const latest_counter& its) {
        latest_counter* const kept = by_counter.find_or_add(package, name);
        if (!kept) {
            ++unlisted;
        } else if (its.time >= kept->time) {
            *kept = its;
        }
    });
    other.by_static.for_each([this](auto package, auto name, const latest_static& its) {
        latest_static* const kept = by_static.find_or_add(package, name);
        if (!kept) {
            ++unlisted;
        } else if (its.time >= kept->time) {
            const uint64_t rank = kept->rank;
            *kept = its;
            kept->rank = rank == 0 ? statics + its.rank : rank;
        }
    });
    statics += other.statics;
    for (const kiv::Event& event : other.messages) keep_message(event);
}

}  // namespace kivd
