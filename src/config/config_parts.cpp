#include "config/config_parts.h"

#include <unistd.h>

#include <algorithm>
#include <array>
#include <climits>
#include <cstdio>
#include <cstdlib>

#include "format/probe_key.h"
#include "list/list_file.h"
#include "list/sorted_list.h"
#include "platform/android_log.h"
#include "runtime/daemon_error.h"
#include "runtime/log_and_raise.h"
#include "util/numbers.h"
#include "util/paths.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-conf";
constexpr char own_package[] = "kivd";

// Holds the highest id that was ever given out; has no file and is never in force.
constexpr probe_key last_id_key = {own_package, "_last_id"};

// One block of malloc with the two texts behind it.
struct config_item {
    probe_key key;
    int32_t id;
    int32_t in_use;  // 1 while in force
};

constinit sorted_list* parts = nullptr;

struct part_path {
    explicit part_path(int32_t id) { snprintf(text, sizeof text, paths::config_part_format, id); }
    char text[sizeof paths::config_part_format + 12];
};

config_item* find_item(const probe_key& key) {
    return static_cast<config_item*>(list_find(*parts, &key));
}

void* make_item(const probe_key& key, int32_t id, int32_t in_use) {
    void* const block = new_probe_element(sizeof(config_item), key);
    if (block == nullptr) return nullptr;
    auto& item = *static_cast<config_item*>(block);
    item.id = id;
    item.in_use = in_use;
    return block;
}

bool is_last_id(const probe_key& key) { return compare_probes(&last_id_key, &key) == 0; }

void* parse_record(const char* record, const char* terminator, void* /*context*/) {
    std::array<const char*, 4> fields;
    const bool is_complete = split_record(record, terminator, fields);
    const probe_key key = {fields[0], fields[1]};
    const int32_t id = is_complete ? parse_saturated(fields[2]) : 0;
    if (id >= 1 || (is_complete && is_last_id(key))) {
        return make_item(key, id, parse_saturated(fields[3]));
    }
    if (fields.back() != nullptr) {
        __android_log_print(ANDROID_LOG_ERROR, tag, "Failed to parse config line.");
    }
    return nullptr;
}

int write_record(FILE* file, const void* element, void* /*context*/) {
    const auto& item = *static_cast<const config_item*>(element);
    record_writer writer(file);
    writer.text(item.key.package);
    writer.text(item.key.name);
    writer.number(item.id);
    writer.number(item.in_use);
    if (writer.finish()) return 1;
    (void)log_and_raise(tag, "Failed to write to configuration list file.");
    return 0;
}

// The id of a part; 0 for the counter, which has the id of one.
int32_t id_of(const void* element) {
    const auto& item = *static_cast<const config_item*>(element);
    return is_last_id(item.key) ? 0 : item.id;
}

// Drops each item that is equal to a neighbour, and that one too.
void drop_equal_items(auto equal) {
    sorted_list& list = *parts;
    uint32_t kept = 0;
    bool equals_last = false;
    for (uint32_t i = 0; i < list.count; ++i) {
        void* const element = list.elements[i];
        const bool equals_next = i + 1 < list.count && equal(element, list.elements[i + 1]);
        if (equals_last || equals_next) {
            const auto& key = static_cast<const config_item*>(element)->key;
            __android_log_print(ANDROID_LOG_ERROR, tag, "Dropped config line <%s::%s>.",
                                key.package, key.name);
            free(element);
        } else {
            list.elements[kept++] = element;
        }
        equals_last = equals_next;
    }
    list.count = kept;
}

// A list file that was damaged may have items that share an id, so that nobody knows whose file it
// is, or that are not found where they stand. A part that is dropped gets a new id when it comes
// with a configuration.
void repair_list() {
    const auto items = [] { return std::span(parts->elements, parts->count); };
    std::ranges::sort(items(), {}, id_of);
    drop_equal_items([](const void* a, const void* b) { return id_of(a) == id_of(b); });
    std::ranges::sort(items(), [](void* a, void* b) { return compare_probes(a, b) < 0; });
    drop_equal_items([](const void* a, const void* b) { return compare_probes(a, b) == 0; });
}

int32_t highest_id() {
    int32_t highest = 0;
    list_foreach<config_item>(
        *parts, [&highest](const config_item& item) { highest = std::max(highest, item.id); });
    return highest;
}

// A list file that has lost its counter must not have an id given out for the second time.
void repair_last_id() {
    if (config_item* const last = find_item(last_id_key)) {
        last->id = highest_id();
        last->in_use = 0;
    } else if (parts->count > 0) {
        void* added = make_item(last_id_key, highest_id(), 0);
        if (added != nullptr) (void)list_add(*parts, added);
    }
}

// An id that was never given out before; below 1 when there is none.
int32_t take_new_id() {
    if (config_item* const last = find_item(last_id_key)) {
        return last->id < INT32_MAX ? ++last->id : 0;
    }
    void* first = make_item(last_id_key, 1, 0);
    if (first == nullptr) return 0;
    if (list_add(*parts, first) == 1) return 1;
    free(first);
    return 0;
}

config_item* add_item(const probe_key& key) {
    const int32_t id = take_new_id();
    if (id < 1) return nullptr;
    void* added = make_item(key, id, 1);
    if (added == nullptr) return nullptr;
    if (list_add(*parts, added) == 1) return static_cast<config_item*>(added);
    (void)log_and_raise(tag, "Failed to add new config item: list_add.");
    free(added);
    return nullptr;
}

void write_part(int32_t id, std::span<const uint8_t> payload) {
    const part_path path(id);
    const unique_fd file = create_file(path.text);
    if (!file.ok() || write_all(file.get(), payload.data(), payload.size()) >= 0) return;
    (void)log_and_raise(tag, "Failed to write config %d with %zu bytes", id, payload.size());
    (void)unlink(path.text);
}

}  // namespace

void load_config_list() {
    parts = list_create(32, 16, compare_probes, nullptr);
    if (parts == nullptr) fatal_error("OOM, while creating config_list_p");
    (void)list_load(*parts, paths::config_list, parse_record, nullptr);
    repair_list();
    repair_last_id();
}

void release_config_list() { list_destroy(parts); }

unique_fd get_config_fd(const char* package, const char* name) {
    const config_item* const item = find_item({package, name});
    if (item == nullptr || item->in_use == 0) return unique_fd();
    return open_regular(part_path(item->id).text);
}

std::optional<file_bytes> read_own_part(const char* name) {
    unique_fd part = get_config_fd(own_package, name);
    if (!part.ok()) return std::nullopt;
    return read_whole_fd(std::move(part));
}

void retire_config_parts() {
    list_foreach<config_item>(*parts, [](config_item& item) { item.in_use = 0; });
}

void store_config_part(const char* package, const char* name, std::span<const uint8_t> payload) {
    const probe_key key = {package, name};
    if (is_last_id(key)) {
        __android_log_print(ANDROID_LOG_WARN, tag, "Skipped part with the reserved name %s.", name);
        return;
    }
    config_item* item = find_item(key);
    if (item == nullptr) item = add_item(key);
    if (item == nullptr) return;
    item->in_use = 1;
    write_part(item->id, payload);
}

bool save_config_list() {
    return list_save(*parts, paths::config_list, write_record, nullptr) != 0;
}

void delete_retired_parts() {
    list_foreach<config_item>(*parts, [](const config_item& item) {
        if (item.in_use == 0 && !is_last_id(item.key)) (void)unlink(part_path(item.id).text);
    });
}

void retire_own_part(const char* name) {
    if (config_item* const item = find_item({own_package, name})) item->in_use = 0;
}

}  // namespace kivd
