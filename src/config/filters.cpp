#include "config/filters.h"

#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <span>
#include <utility>

#include "config.pb-c.h"
#include "config/config_parts.h"
#include "format/probe_key.h"
#include "list/list_file.h"
#include "list/sorted_list.h"
#include "runtime/daemon_error.h"
#include "runtime/log_and_raise.h"
#include "util/paths.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-filter";

using filter_message = Kiv__Config__Filter;
constexpr int32_t include_type = KIV__CONFIG__FILTER__TYPE__INCLUDE;
constexpr int32_t exclude_type = KIV__CONFIG__FILTER__TYPE__EXCLUDE;

// An entry of a filter's list is a probe_key with its texts behind it.
using unique_list = std::unique_ptr<sorted_list, releaser<list_destroy>>;

struct filter {
    const char* path;
    sorted_list* list;
    int32_t type;
};
constinit filter filters[] = {
    {paths::counter_filter, nullptr, exclude_type},
    {paths::static_data_filter, nullptr, exclude_type},
    {paths::event_filter, nullptr, exclude_type},
};

// In the list of a filter that excludes; that is how the type outlives a restart.
constexpr probe_key exclude_marker = {"__type", "exclude"};

// A package that starts with "*" is equal to every other, a name that does to every name of its
// package.
int filter_compare(const void* key, const void* entry) {
    const auto& wanted = *static_cast<const probe_key*>(key);
    const auto& present = *static_cast<const probe_key*>(entry);
    if (*wanted.package == '*' || *present.package == '*') return 0;
    if (const int order = strcmp(wanted.package, present.package); order != 0) return order;
    if (*wanted.name == '*' || *present.name == '*') return 0;
    return strcmp(wanted.name, present.name);
}

sorted_list* create_filter_list() { return list_create(256, 128, filter_compare, nullptr); }

void* make_entry(const probe_key& key) { return new_probe_element(sizeof(probe_key), key); }

void* parse_record(const char* record, const char* terminator, void* /*context*/) {
    const char* const name = record + strlen(record) + 1;
    if (name < terminator) return make_entry({record, name});
    (void)log_and_raise(tag, "Failed to parse config line.");
    return nullptr;
}

int write_record(FILE* file, const void* element, void* /*context*/) {
    const auto& key = *static_cast<const probe_key*>(element);
    record_writer writer(file);
    writer.text(key.package);
    writer.text(key.name);
    if (writer.finish()) return 1;
    (void)log_and_raise(tag, "Failed to write to filter list file.");
    return 0;
}

// By its texts alone: to filter_compare a wildcard is equal to the marker too.
bool holds_exclude_marker(const sorted_list& list) {
    return std::any_of(list.elements, list.elements + list.count, [](const void* entry) {
        return compare_probes(&exclude_marker, entry) == 0;
    });
}

bool load_filter(filter& loaded) {
    loaded.list = create_filter_list();
    if (loaded.list == nullptr) fatal_error("OOM, while creating config_list_p");
    const bool complete = list_load(*loaded.list, loaded.path, parse_record, nullptr) != 0;
    loaded.type = complete && !holds_exclude_marker(*loaded.list) ? include_type : exclude_type;
    return complete;
}

void install_filter(filter& replaced, unique_list list, int32_t type) {
    list_destroy(replaced.list);
    replaced.list = list.release();
    replaced.type = type;
}

// From now on everything is accepted.
void reset_filter(filter& reset) {
    unique_list empty(create_filter_list());
    if (!empty) return;
    (void)unlink(reset.path);
    install_filter(reset, std::move(empty), exclude_type);
}

// Puts the first items into `keys`, in the order of their texts. False when two of them are equal
// to filter_compare: then two neighbours are.
bool sort_items(const filter_message& wanted, std::span<probe_key> keys) {
    for (size_t i = 0; i < keys.size(); ++i) {
        keys[i] = {wanted.item[i]->package, wanted.item[i]->name};
    }
    std::ranges::sort(
        keys, [](const probe_key& a, const probe_key& b) { return compare_probes(&a, &b) < 0; });
    const auto equal = [](const probe_key& a, const probe_key& b) {
        return filter_compare(&a, &b) == 0;
    };
    return std::ranges::adjacent_find(keys, equal) == keys.end();
}

// The same with as many of the first items as go together; gives how many those are.
size_t sort_compatible_items(const filter_message& wanted, std::span<probe_key> keys) {
    if (sort_items(wanted, keys)) return keys.size();
    size_t compatible = 1;
    size_t too_many = keys.size();
    while (too_many - compatible > 1) {
        const size_t middle = compatible + (too_many - compatible) / 2;
        (sort_items(wanted, keys.first(middle)) ? compatible : too_many) = middle;
    }
    (void)sort_items(wanted, keys.first(compatible));
    return compatible;
}

bool out_of_memory(const char* what) {
    (void)log_and_raise(tag, "Out Of Memory creating %s filter, new probe filter not activated!",
                        what);
    return false;
}

bool append_entry(sorted_list& list, const probe_key& key) {
    void* entry = make_entry(key);
    return entry != nullptr && list_append(list, entry) == 1;
}

bool add_entry(sorted_list& list, const probe_key& key) {
    void* entry = make_entry(key);
    if (entry != nullptr && list_add(list, entry) == 1) return true;
    free(entry);
    return false;
}

// Items are put in sorted rather than added one by one: there may be a great many.
bool add_items(sorted_list& list, const filter_message& wanted) {
    const unique_malloc<probe_key> keys(
        static_cast<probe_key*>(malloc((wanted.n_item + 1) * sizeof(probe_key))));
    if (!keys) return out_of_memory("probe");
    const std::span<probe_key> all(keys.get(), wanted.n_item);
    const size_t compatible = sort_compatible_items(wanted, all);
    for (const probe_key& key : all.first(compatible)) {
        if (!append_entry(list, key)) return out_of_memory("probe");
    }
    if (compatible == all.size()) return true;

    const auto& clashing = *wanted.item[compatible];
    if (add_entry(list, {clashing.package, clashing.name})) return true;
    (void)log_and_raise(tag,
                        "Failed adding probe <%s><%s> to filter, new probe filter not activated!",
                        clashing.package, clashing.name);
    return false;
}

bool add_exclude_marker(sorted_list& list) {
    if (add_entry(list, exclude_marker)) return true;
    (void)log_and_raise(tag, "Failed adding exclude filter, new probe filter not activated!");
    return false;
}

// As it came. An enumeration may not be read as one when it holds a number that is none of it.
int32_t type_of(const filter_message& message) {
    int32_t type = 0;
    static_assert(sizeof message.type == sizeof type);
    memcpy(&type, &message.type, sizeof type);
    return type;
}

void apply_filter(filter& applied, const filter_message* wanted) {
    if (wanted == nullptr) return reset_filter(applied);
    const int32_t type = type_of(*wanted);
    unique_list list(create_filter_list());
    if (!list || !add_items(*list, *wanted) ||
        (type == exclude_type && !add_exclude_marker(*list)) ||
        list_save(*list, applied.path, write_record, nullptr) == 0) {
        return reset_filter(applied);
    }
    install_filter(applied, std::move(list), type);
}

filter& get_filter(filter_kind kind) { return filters[static_cast<size_t>(kind)]; }

}  // namespace

bool load_filters() {
    bool events_loaded = false;
    for (filter& each : filters) events_loaded = load_filter(each);
    return events_loaded;  // the last one's
}

void release_filters() {
    for (filter& each : filters) list_destroy(each.list);
}

void apply_filter_config() {
    const auto config = unpack_own_part<kiv__config__filter_config__unpack,
                                        kiv__config__filter_config__free_unpacked>("FilterConfig");
    const auto wanted = [&config](auto field) { return config ? config.get()->*field : nullptr; };
    using message = Kiv__Config__FilterConfig;
    apply_filter(get_filter(filter_kind::counters), wanted(&message::counter_filter));
    apply_filter(get_filter(filter_kind::static_data), wanted(&message::staticdata_filter));
    apply_filter(get_filter(filter_kind::events), wanted(&message::event_filter));
}

bool filter_match(filter_kind kind, const char* package, const char* name) {
    const filter& asked = get_filter(kind);
    const probe_key key = {package, name};
    const bool found = list_find(*asked.list, &key) != nullptr;
    if (asked.type == include_type) return found;
    return asked.type == exclude_type && !found;
}

}  // namespace kivd
