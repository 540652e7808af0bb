#include "config/config_parts.h"

#include <unistd.h>

#include <algorithm>
#include <array>
#include <climits>
#include <cstdio>
#include <cstring>
#include <iterator>
#include <string_view>

#include "format/probe_key.h"
#include "list/list_file.h"
#include "list/sorted_list.h"
#include "platform/android_log.h"
#include "runtime/log_and_raise.h"
#include "util/numbers.h"
#include "util/paths.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-conf";

// Holds the highest id that was ever given out; has no file and is never in force.
constexpr probe_key last_id_key = {own_package, "_last_id"};

struct config_item : probe_key {
    int32_t id;
    int32_t in_use;  // 1 while in force
};

constinit sorted_list<config_item> parts(16);

struct part_path {
    explicit part_path(int32_t id) { snprintf(text, sizeof text, paths::config_part_format, id); }
    char text[sizeof paths::config_part_format + 12];
};

bool is_last_id(const probe_key& key) { return compare_probes(last_id_key, key) == 0; }

unique_entry<config_item> parse_record(std::string_view record) {
    std::array<const char*, 4> fields;
    const bool is_complete = split_list_record(record, fields);
    const probe_key key = {fields[0], fields[1]};
    const int32_t id = is_complete ? parse_saturated(fields[2]) : 0;
    if (id >= 1 || (is_complete && is_last_id(key))) {
        return make_entry<config_item>(key, id, parse_saturated(fields[3]));
    }
    if (fields.back() != nullptr) {
        __android_log_print(ANDROID_LOG_ERROR, tag, "Failed to parse config line.");
    }
    return nullptr;
}

bool write_record(list_writer& writer, const config_item& item) {
    writer.text(item.package);
    writer.text(item.name);
    writer.number(item.id);
    writer.number(item.in_use);
    if (writer.end_record()) return true;
    return log_and_raise(tag, "Failed to write to configuration list file.");
}

// The id of a part; 0 for the counter, which has the id of one.
int32_t id_of(const config_item& item) { return is_last_id(item) ? 0 : item.id; }

// Puts the list into `order` (below 0, 0, above 0), and drops each item that is equal in it to a
// neighbour, and that one too.
void sort_and_drop_equal(auto order) {
    parts.sort([order](const config_item& a, const config_item& b) { return order(a, b) < 0; });
    bool equals_previous = false;
    parts.drop_if([&](const config_item& item, const config_item* next) {
        const bool equals_next = next != nullptr && order(item, *next) == 0;
        const bool dropped = equals_previous || equals_next;
        equals_previous = equals_next;
        if (dropped) {
            __android_log_print(ANDROID_LOG_ERROR, tag, "Dropped config line <%s::%s>.",
                                item.package, item.name);
        }
        return dropped;
    });
}

// A list file that was damaged may have items that share an id, so that nobody knows whose file it
// is, or that are not found where they stand. A part that is dropped gets a new id when it comes
// with a configuration.
void repair_list() {
    sort_and_drop_equal([](const config_item& a, const config_item& b) {
        return id_of(a) < id_of(b) ? -1 : static_cast<int>(id_of(a) > id_of(b));
    });
    sort_and_drop_equal(compare_probes);
}

int32_t highest_id() {
    int32_t highest = 0;
    parts.for_each([&](const config_item& item) { highest = std::max(highest, item.id); });
    return highest;
}

// An item that is not there yet; null when there is no memory.
config_item* add_item(const probe_key& key, int32_t id, int32_t in_use) {
    unique_entry<config_item> added = make_entry<config_item>(key, id, in_use);
    return added ? parts.add(std::move(added)) : nullptr;
}

// A list file that has lost its counter must not have an id given out for the second time.
void repair_last_id() {
    if (config_item* const last = parts.find(last_id_key)) {
        last->id = highest_id();
        last->in_use = 0;
    } else if (parts.size() > 0) {
        (void)add_item(last_id_key, highest_id(), 0);
    }
}

// An id that was never given out before; below 1 when there is none.
int32_t take_new_id() {
    config_item* last = parts.find(last_id_key);
    if (last == nullptr) last = add_item(last_id_key, 0, 0);
    return last != nullptr && last->id < INT32_MAX ? ++last->id : 0;
}

config_item* add_part(const probe_key& key) {
    const int32_t id = take_new_id();
    if (id < 1) return nullptr;
    config_item* const added = add_item(key, id, 1);
    if (added == nullptr) log_and_raise(tag, "Failed to add new config item: list_add.");
    return added;
}

bool write_part(int32_t id, std::span<const uint8_t> payload) {
    const part_path path(id);
    const unique_fd file = create_file(path.text);
    if (file.ok() && write_all(file.get(), payload.data(), payload.size())) return true;
    (void)unlink(path.text);
    return log_and_raise(tag, "Failed to write config %d with %zu bytes", id, payload.size());
}

bool is_retired(const config_item& item) { return item.in_use == 0 && !is_last_id(item); }

void delete_file_of(const config_item& item) { (void)unlink(part_path(item.id).text); }

// The places of the parts that left earlier; their ids are not given out again.
void free_places() {
    parts.drop_if([](const config_item& item, const config_item* /*next*/) {
        if (is_retired(item)) delete_file_of(item);
        return is_retired(item);
    });
}

}  // namespace

void load_config_list() {
    parts.clear();
    (void)list_load(parts, paths::config_list, parse_record);
    repair_list();
    repair_last_id();
}

void release_config_list() { parts.clear(); }

unique_fd get_config_fd(const char* package, const char* name) {
    const config_item* const item = parts.find({package, name});
    if (item == nullptr || item->in_use == 0) return unique_fd();
    return open_regular(part_path(item->id).text);
}

std::optional<file_bytes> read_own_part(const char* name) {
    unique_fd part = get_config_fd(own_package, name);
    if (!part.ok()) return std::nullopt;
    return read_whole_fd(std::move(part));
}

bool can_hold_parts(new_parts given) {
    constexpr size_t most_parts = list_records_max - 1;  // beside the highest id
    if (given.size() > most_parts) {
        return log_and_raise(tag, "Too many parts: %zu, of at most %zu", given.size(), most_parts);
    }
    char digits[20];
    const char* const end = format_int64(digits, highest_id() + std::ssize(given));
    const size_t numbers_size = static_cast<size_t>(end - digits) + 1;  // an id, and in_use
    for (const Kiv__Config__ConfigPart* part : given) {
        const size_t text_size = strlen(part->package) + strlen(part->name);
        if (fits_list_record(4, text_size + numbers_size)) continue;
        return log_and_raise(tag, "Too long name of part [%s:%s]", part->package, part->name);
    }
    return true;
}

void retire_config_parts(new_parts next) {
    parts.for_each([](config_item& item) { item.in_use = 0; });
    size_t added = parts.find(last_id_key) != nullptr ? 0 : 1;
    for (const Kiv__Config__ConfigPart* part : next) {
        config_item* const item = parts.find({part->package, part->name});
        item != nullptr ? item->in_use = 1 : ++added;
    }
    if (parts.size() + added > list_records_max) free_places();
    parts.for_each([](config_item& item) { item.in_use = 0; });
}

void store_config_part(const char* package, const char* name, std::span<const uint8_t> payload) {
    const probe_key key = {package, name};
    if (is_last_id(key)) {
        __android_log_print(ANDROID_LOG_WARN, tag, "Skipped part with the reserved name %s.", name);
        return;
    }
    config_item* item = parts.find(key);
    if (item == nullptr) item = add_part(key);
    if (item != nullptr) item->in_use = static_cast<int32_t>(write_part(item->id, payload));
}

bool save_config_list() { return list_save(parts, paths::config_list, write_record); }

void delete_retired_parts() {
    parts.for_each([](const config_item& item) {
        if (is_retired(item)) delete_file_of(item);
    });
}

void retire_own_part(const char* name) {
    if (config_item* const item = parts.find({own_package, name})) item->in_use = 0;
}

}  // namespace kivd
