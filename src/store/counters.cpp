#include "store/counters.h"

#include <cerrno>
#include <cstring>

#include "config/filters.h"
#include "config/limits.h"
#include "format/record_format.h"
#include "list/list_file.h"
#include "list/sorted_list.h"
#include "runtime/daemon_error.h"
#include "runtime/log_and_raise.h"
#include "util/clock.h"
#include "util/numbers.h"
#include "util/paths.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-counters";
constexpr size_t report_record_size = 346;

// One block of malloc with the two texts behind it.
struct counter_entry {
    probe_key key;
    int64_t from_timestamp;  // created, in ms
    int64_t to_timestamp;    // last set or incremented, in ms
    int64_t value;
};

constinit sorted_list* list = nullptr;
constinit bool dirty = false;

void* make_entry(const probe_key& key, int64_t from, int64_t to, int64_t value) {
    void* const block = new_probe_element(sizeof(counter_entry), key);
    if (block == nullptr) return nullptr;
    auto& counter = *static_cast<counter_entry*>(block);
    counter.from_timestamp = from;
    counter.to_timestamp = to;
    counter.value = value;
    return block;
}

void* parse_record(const char* record, const char* terminator, void* /*context*/) {
    record_fields fields;
    if (!split_record(record, terminator, fields)) {
        (void)log_and_raise(tag, "Failed to parse counter line.");
        return nullptr;
    }
    return make_entry({fields[0], fields[1]}, parse_int64(fields[2]), parse_int64(fields[3]),
                      parse_int64(fields[4]));
}

int write_record(FILE* file, const void* element, void* context) {
    const auto& counter = *static_cast<const counter_entry*>(element);
    const int64_t cutoff_ms = *static_cast<const int64_t*>(context);
    if (counter.to_timestamp <= cutoff_ms) return 1;

    record_writer writer(file);
    writer.text(counter.key.package);
    writer.text(counter.key.name);
    writer.number(counter.from_timestamp);
    writer.number(counter.to_timestamp);
    writer.number(counter.value);
    if (writer.finish()) return 1;
    (void)log_and_raise(tag, "Failed to write to counters file: %s", strerror(errno));
    return 0;
}

}  // namespace

void counters_init() {
    list = list_create(256, 128, compare_probes, nullptr);
    if (list == nullptr) fatal_error("OOM, while creating clist_p");
    dirty = false;
    list_use_index(*list);
    (void)list_load(*list, paths::counters, parse_record, nullptr);
}

void counters_update(const char* package, const char* name, int32_t value, counter_mode mode) {
    if (!filter_match(filter_kind::counters, package, name)) return;
    const probe_key key = {package, name};
    const int64_t now = now_ms();
    if (void* const found = list_find(*list, &key)) {
        auto& counter = *static_cast<counter_entry*>(found);
        const auto base =
            mode == counter_mode::increment ? static_cast<uint64_t>(counter.value) : 0;
        counter.value = static_cast<int64_t>(base + static_cast<uint64_t>(int64_t{value}));
        counter.to_timestamp = now;
        dirty = true;
        return;
    }
    void* entry = make_entry(key, now, now, value);
    if (entry == nullptr) return;
    if (list_add(*list, entry) == 0) {
        (void)log_and_raise(tag, "Failed to add new counter.");
        return;
    }
    dirty = true;
}

void counters_save() {
    if (!dirty) return;
    int64_t cutoff_ms = expiry_cutoff_ms(get_limits().expire_counters_age);
    if (list_save(*list, paths::counters, write_record, &cutoff_ms) != 0) dirty = false;
}

void counters_write_report(record_appender& report, int64_t since_ms) {
    list_foreach<counter_entry>(*list, [&report, since_ms](const counter_entry& counter) {
        if (counter.to_timestamp < since_ms) return;
        uint8_t record[report_record_size];
        const size_t size =
            pack_counter_record(record, counter.key.package, counter.key.name,
                                counter.from_timestamp, counter.to_timestamp, counter.value);
        report.append({record, size}, tag);
    });
    report.flush(tag);
}

bool counters_pending(int64_t since_ms) {
    for (uint32_t i = 0; i < list->count; ++i) {
        const auto& counter = *static_cast<const counter_entry*>(list->elements[i]);
        if (counter.to_timestamp >= since_ms) return true;
    }
    return false;
}

void counters_release() { list_destroy(list); }

}  // namespace kivd
