#include "store/counters.h"

#include <array>
#include <cerrno>
#include <cstring>

#include "config/filters.h"
#include "format/record_format.h"
#include "runtime/log_and_raise.h"
#include "store/probe_store.h"
#include "util/clock.h"
#include "util/numbers.h"
#include "util/paths.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-counters";

struct counter_entry : probe_key {
    int64_t from_timestamp;  // created, in ms
    int64_t to_timestamp;    // last set or incremented, in ms
    int64_t value;

    static constexpr size_t report_record_size = 346;

    static unique_entry<counter_entry> parse(std::string_view record) {
        std::array<const char*, 5> fields;
        if (!split_list_record(record, fields)) {
            log_and_raise(tag, "Failed to parse counter line.");
            return nullptr;
        }
        return make_entry<counter_entry>({fields[0], fields[1]}, parse_int64(fields[2]),
                                         parse_int64(fields[3]), parse_int64(fields[4]));
    }
    [[nodiscard]] bool write(list_writer& writer) const {
        writer.text(package);
        writer.text(name);
        writer.number(from_timestamp);
        writer.number(to_timestamp);
        writer.number(value);
        if (writer.end_record()) return true;
        return log_and_raise(tag, "Failed to write to counters file: %s", strerror(errno));
    }
    [[nodiscard]] size_t pack(std::span<uint8_t> record) const {
        return pack_counter_record(record, package, name, from_timestamp, to_timestamp, value);
    }
    [[nodiscard]] int64_t changed_ms() const { return to_timestamp; }
    [[nodiscard]] int64_t seen_ms() const { return to_timestamp; }
};

constinit probe_store<counter_entry> store(tag, paths::counters, &limits::expire_counters_age);

}  // namespace

void counters_init() { store.load(); }

void counters_update(const char* package, const char* name, int32_t value, counter_mode mode,
                     uid_t user) {
    if (!filter_match(filter_kind::counters, package, name)) return;
    const probe_key key = {package, name};
    const int64_t now = now_ms();
    if (counter_entry* const counter = store.find(key)) {
        const auto base =
            mode == counter_mode::increment ? static_cast<uint64_t>(counter->value) : 0;
        counter->value = static_cast<int64_t>(base + static_cast<uint64_t>(int64_t{value}));
        counter->to_timestamp = now;
        store.mark_changed();
        return;
    }
    if (!store.make_room(key, user)) return;
    unique_entry<counter_entry> added = make_entry<counter_entry>(key, now, now, int64_t{value});
    if (added && !store.add(std::move(added), user))
        log_and_raise(tag, "Failed to add new counter.");
}

void counters_save() { store.save(); }

void counters_write_report(record_appender& report, int64_t since_ms) {
    store.write_report(report, since_ms);
}

bool counters_pending(int64_t since_ms) { return store.is_pending(since_ms); }

void counters_release() { store.release(); }

}  // namespace kivd
