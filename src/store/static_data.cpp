#include "store/static_data.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "config/filters.h"
#include "config/limits.h"
#include "format/record_format.h"
#include "list/list_file.h"
#include "list/sorted_list.h"
#include "platform/android_log.h"
#include "runtime/daemon_error.h"
#include "runtime/log_and_raise.h"
#include "util/clock.h"
#include "util/numbers.h"
#include "util/paths.h"
#include "util/unique_fd.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-sdata";
constexpr size_t report_record_size = 512;
constexpr size_t saved_value_size = 256;

// One block of malloc with package and name behind it.
struct static_entry {
    probe_key key;
    int64_t timestamp;  // when the value last changed, in ms
    int64_t last_seen;  // when it was last set, in ms
    char* value;        // a block of its own
};

constinit sorted_list* list = nullptr;
constinit bool dirty = false;

void destroy_entry(void* element) { free(static_cast<static_entry*>(element)->value); }

void* make_entry(const probe_key& key, int64_t timestamp, int64_t last_seen, const char* value) {
    unique_malloc<char> value_copy(strdup(value));
    if (!value_copy) return nullptr;
    void* const block = new_probe_element(sizeof(static_entry), key);
    if (block == nullptr) return nullptr;
    auto& item = *static_cast<static_entry*>(block);
    item.timestamp = timestamp;
    item.last_seen = last_seen;
    item.value = value_copy.release();
    return block;
}

const char* or_null(const char* text) { return text != nullptr ? text : "NULL"; }

void* parse_record(const char* record, const char* terminator, void* /*context*/) {
    record_fields fields;
    if (!split_record(record, terminator, fields)) {
        __android_log_print(ANDROID_LOG_ERROR, tag, "Failed to parse sdata line <%s::%s>",
                            or_null(fields[0]), or_null(fields[1]));
        return nullptr;
    }
    return make_entry({fields[0], fields[1]}, parse_int64(fields[2]), parse_int64(fields[3]),
                      fields[4]);
}

int write_record(FILE* file, const void* element, void* context) {
    const auto& item = *static_cast<const static_entry*>(element);
    const int64_t cutoff_ms = *static_cast<const int64_t*>(context);
    if (item.last_seen <= cutoff_ms) return 1;

    record_writer writer(file);
    writer.text(item.key.package);
    writer.text(item.key.name);
    writer.number(item.timestamp);
    writer.number(item.last_seen);
    writer.text({item.value, strnlen(item.value, saved_value_size)});
    if (writer.finish()) return 1;
    (void)log_and_raise(tag, "Failed to write to sdata file: %s", strerror(errno));
    return 0;
}

void change_value(static_entry& item, const char* value, int64_t now) {
    char* const copy = strdup(value);
    if (copy == nullptr) return;
    free(item.value);
    item.value = copy;
    item.timestamp = now;
    dirty = true;
}

}  // namespace

void static_data_init() {
    list = list_create(256, 128, compare_probes, destroy_entry);
    if (list == nullptr) fatal_error("OOM, while creating sdlist_p");
    dirty = false;
    list_use_index(*list);
    (void)list_load(*list, paths::static_data, parse_record, nullptr);
}

void static_data_set(const char* package, const char* name, const char* value) {
    if (!filter_match(filter_kind::static_data, package, name)) return;
    const probe_key key = {package, name};
    const int64_t now = now_ms();
    if (void* const found = list_find(*list, &key)) {
        auto& item = *static_cast<static_entry*>(found);
        item.last_seen = now;
        if (strcmp(item.value, value) != 0) change_value(item, value, now);
        return;
    }
    void* entry = make_entry(key, now, now, value);
    if (entry == nullptr) return;
    if (list_add(*list, entry) == 0) {
        (void)log_and_raise(tag, "Failed to add new static data.");
        return;
    }
    dirty = true;
}

void static_data_save() {
    if (!dirty) return;
    int64_t cutoff_ms = expiry_cutoff_ms(get_limits().expire_sdata_age);
    if (list_save(*list, paths::static_data, write_record, &cutoff_ms) != 0) dirty = false;
}

void static_data_write_report(record_appender& report, int64_t since_ms) {
    list_foreach<static_entry>(*list, [&report, since_ms](const static_entry& item) {
        if (item.timestamp < since_ms) return;
        uint8_t record[report_record_size];
        const size_t size =
            pack_static_record(record, item.key.package, item.key.name, item.timestamp, item.value);
        report.append({record, size}, tag);
    });
    report.flush(tag);
}

bool static_data_pending(int64_t since_ms) {
    for (uint32_t i = 0; i < list->count; ++i) {
        const auto& item = *static_cast<const static_entry*>(list->elements[i]);
        if (item.timestamp >= since_ms) return true;
    }
    return false;
}

void static_data_release() { list_destroy(list); }

}  // namespace kivd
