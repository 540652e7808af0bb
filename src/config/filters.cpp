#include "config/filters.h"

#include <unistd.h>

#include <cstdlib>
#include <cstring>
#include <span>
#include <string_view>
#include <utility>

#include "config.pb-c.h"
#include "config/config_parts.h"
#include "format/probe_filter.h"
#include "list/list_file.h"
#include "list/sorted_list.h"
#include "runtime/log_and_raise.h"
#include "util/paths.h"
#include "util/releaser.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-filter";

using filter_message = Kiv__Config__Filter;
constexpr int32_t include_type = KIV__CONFIG__FILTER__TYPE__INCLUDE;
constexpr int32_t exclude_type = KIV__CONFIG__FILTER__TYPE__EXCLUDE;

struct filter_item : probe_key {};
using filter_list = sorted_list<filter_item>;

struct filter {
    constexpr filter(const char* file) : path(file) {}

    const char* path;
    filter_list list{128, compare_filtered};
    int32_t type = exclude_type;
};
constinit filter filters[] = {
    {paths::counter_filter},
    {paths::static_data_filter},
    {paths::event_filter},
};

// In the list of a filter that excludes; that is how the type outlives a restart.
constexpr probe_key exclude_marker = {"__type", "exclude"};

unique_entry<filter_item> parse_record(std::string_view record) {
    const char* const package = record.data();
    const char* const name = package + strlen(package) + 1;
    if (name < package + record.size()) return make_entry<filter_item>({package, name});
    log_and_raise(tag, "Failed to parse config line.");
    return nullptr;
}

bool write_record(list_writer& writer, const filter_item& item) {
    writer.text(item.package);
    writer.text(item.name);
    if (writer.end_record()) return true;
    return log_and_raise(tag, "Failed to write to filter list file.");
}

// By its texts alone: to compare_filtered a wildcard is equal to the marker too.
bool holds_exclude_marker(const filter_list& list) {
    return list.any_of(
        [](const filter_item& item) { return compare_probes(exclude_marker, item) == 0; });
}

bool load_filter(filter& loaded) {
    loaded.list.clear();
    const bool complete = list_load(loaded.list, loaded.path, parse_record);
    loaded.type = complete && !holds_exclude_marker(loaded.list) ? include_type : exclude_type;
    return complete;
}

// From now on everything is accepted.
void reset_filter(filter& reset) {
    (void)unlink(reset.path);
    reset.list.clear();
    reset.type = exclude_type;
}

bool out_of_memory() {
    return log_and_raise(tag,
                         "Out Of Memory creating probe filter, new probe filter not activated!");
}

// Returns the items as they came, in a block of `count` and as many places more to sort them in.
unique_malloc<probe_key> copy_keys(const filter_message& wanted) {
    unique_malloc<probe_key> keys(
        static_cast<probe_key*>(malloc((2 * wanted.n_item + 1) * sizeof(probe_key))));
    for (size_t i = 0; keys && i < wanted.n_item; ++i) {
        keys.get()[i] = {wanted.item[i]->package, wanted.item[i]->name};
    }
    return keys;
}

// Items are put in sorted rather than added one by one: there may be a great many.
bool add_items(filter_list& list, const filter_message& wanted) {
    const unique_malloc<probe_key> keys = copy_keys(wanted);
    if (!keys) return out_of_memory();
    const std::span<probe_key> items(keys.get(), wanted.n_item);
    const std::span<probe_key> sorted(keys.get() + wanted.n_item, wanted.n_item);
    const size_t compatible = sort_compatible(items, sorted);
    for (const probe_key& key : sorted.first(compatible)) {
        unique_entry<filter_item> item = make_entry<filter_item>(key);
        if (!item || !list.append(std::move(item))) return out_of_memory();
    }
    if (compatible == items.size()) return true;

    const probe_key& clashing = items[compatible];
    unique_entry<filter_item> refused = make_entry<filter_item>(clashing);
    if (refused) (void)list.add(std::move(refused));  // which says why
    return log_and_raise(tag,
                         "Failed adding probe <%s><%s> to filter, new probe filter not activated!",
                         clashing.package, clashing.name);
}

bool add_exclude_marker(filter_list& list) {
    unique_entry<filter_item> marker = make_entry<filter_item>(exclude_marker);
    if (marker && list.add(std::move(marker)) != nullptr) return true;
    return log_and_raise(tag, "Failed adding exclude filter, new probe filter not activated!");
}

// As it came: an enumeration may not be read as one while it may hold a value outside of it.
int32_t type_of(const filter_message& message) {
    int32_t type = 0;
    static_assert(sizeof message.type == sizeof type);
    memcpy(&type, &message.type, sizeof type);
    return type;
}

void apply_filter(filter& applied, const filter_message* wanted) {
    if (wanted == nullptr) return reset_filter(applied);
    filter_list list(128, compare_filtered);
    const int32_t type = type_of(*wanted);
    if (!add_items(list, *wanted) || (type == exclude_type && !add_exclude_marker(list)) ||
        !list_save(list, applied.path, write_record)) {
        return reset_filter(applied);
    }
    applied.list = std::move(list);
    applied.type = type;
}

using filter_config = Kiv__Config__FilterConfig;
constexpr const ProtobufCMessageDescriptor& config_type = kiv__config__filter_config__descriptor;

bool can_hold(const filter_message* filter) {
    if (filter == nullptr) return true;
    constexpr size_t most_records = list_records_max - 1;
    const size_t records = filter->n_item + (type_of(*filter) == exclude_type ? 1 : 0);
    if (records > most_records) {
        return log_and_raise(tag, "Too many items in a filter: %zu", filter->n_item);
    }
    for (size_t i = 0; i < filter->n_item; ++i) {
        const auto& item = *filter->item[i];
        if (fits_list_record(2, strlen(item.package) + strlen(item.name))) continue;
        return log_and_raise(tag, "Too long filter item <%s><%s>", item.package, item.name);
    }
    return true;
}

filter& get_filter(filter_kind kind) { return filters[static_cast<size_t>(kind)]; }

}  // namespace

bool load_filters() {
    bool events_loaded = false;
    for (filter& each : filters) events_loaded = load_filter(each);
    return events_loaded;  // the last one's
}

void release_filters() {
    for (filter& each : filters) {
        each.list.clear();
        each.type = exclude_type;
    }
}

bool can_hold_filters(std::span<const uint8_t> part) {
    if (measure_message(config_type, part) == message_size::too_large) {
        return log_and_raise(tag, "Too many items in the filters");
    }
    const auto config = unpack_message<filter_config>(config_type, part);
    return !config || (can_hold(config->counter_filter) && can_hold(config->staticdata_filter) &&
                       can_hold(config->event_filter));
}

void apply_filter_config() {
    const auto config = unpack_own_part<filter_config>(config_type, filter_part_name);
    const auto wanted = [&config](auto field) { return config ? config.get()->*field : nullptr; };
    apply_filter(get_filter(filter_kind::counters), wanted(&filter_config::counter_filter));
    apply_filter(get_filter(filter_kind::static_data), wanted(&filter_config::staticdata_filter));
    apply_filter(get_filter(filter_kind::events), wanted(&filter_config::event_filter));
}

bool filter_match(filter_kind kind, const char* package, const char* name) {
    const filter& asked = get_filter(kind);
    const bool found = asked.list.find({package, name}) != nullptr;
    if (asked.type == include_type) return found;
    return asked.type == exclude_type && !found;
}

}  // namespace kivd
