// The parts of a configuration that the daemon reads itself. The first byte of the input says which
// one the rest is; see `parts`.
#include <algorithm>
#include <cstring>
#include <vector>

#include "config.pb-c.h"
#include "config/config_parts.h"
#include "config/filters.h"
#include "config/limits.h"
#include "config/settings.h"
#include "format/protobuf_message.h"
#include "fuzz/harness.h"
#include "intake/run_actions.h"
#include "report/output_dir.h"
#include "util/paths.h"

namespace kivd {
namespace {

using filter_message = Kiv__Config__Filter;

bool equals(const char* text, const char* other) { return strcmp(text, other) == 0; }

// Whether the filter is the same after a restart. Its file has no room for every one: an empty name
// or a record too long is not read back, the type is told by a marker among the items, and there
// are two types.
bool survives_restart(const filter_message& filter) {
    int32_t type = 0;
    memcpy(&type, &filter.type, sizeof type);  // may be none of its enumeration
    if (type != KIV__CONFIG__FILTER__TYPE__INCLUDE && type != KIV__CONFIG__FILTER__TYPE__EXCLUDE) {
        return false;
    }
    return std::all_of(filter.item, filter.item + filter.n_item, [](const auto* item) {
        return *item->name != '\0' && strlen(item->package) + strlen(item->name) < 1000 &&
               !(equals(item->package, "__type") && equals(item->name, "exclude"));
    });
}

// What each kind of filter says of the probes that are named in one of them, and of another.
std::vector<bool> ask_filters(const Kiv__Config__FilterConfig& config) {
    std::vector<bool> answers;
    const auto ask = [&answers](const char* package, const char* name) {
        for (const auto kind :
             {filter_kind::counters, filter_kind::static_data, filter_kind::events}) {
            answers.push_back(filter_match(kind, package, name));
        }
    };
    ask("shop", "order");
    for (const auto* filter :
         {config.counter_filter, config.staticdata_filter, config.event_filter}) {
        if (filter == nullptr) continue;
        for (size_t i = 0; i < std::min<size_t>(filter->n_item, 100); ++i) {
            ask(filter->item[i]->package, filter->item[i]->name);
        }
    }
    return answers;
}

void apply_filters(input_bytes part) {
    apply_filter_config();
    const auto config =
        unpack_message<Kiv__Config__FilterConfig>(kiv__config__filter_config__descriptor, part);
    if (!config) {
        require(!exists(paths::event_filter), "a filter without a configuration");
        return;
    }
    const std::vector<bool> answers = ask_filters(*config);
    apply_filter_config();
    require(ask_filters(*config) == answers, "the same filters, built again, differ");

    for (const auto* filter :
         {config->counter_filter, config->staticdata_filter, config->event_filter}) {
        if (filter != nullptr && !survives_restart(*filter)) return;
    }
    release_filters();
    (void)load_filters();
    // A filter that keeps everything has no file, which after a restart means the same.
    require(ask_filters(*config) == answers, "a restart changes the filters");
}

void apply_limits(input_bytes /*part*/) {
    apply_settings();
    const limits applied = get_limits();
    require(applied.max_report_size <= applied.max_output_dir_size,
            "a report may be larger than the directory that it goes to");
    apply_settings();
    require(memcmp(&applied, &get_limits(), sizeof applied) == 0,
            "the same settings, applied again, differ");
}

void act_once(input_bytes /*part*/) {
    const report_path report(1);
    write_file(report.text, {});
    run_actions_once();
    const bool kept = exists(report.text);
    write_file(report.text, {});
    run_actions_once();
    require(kept || exists(report.text), "reports are removed twice");
}

struct part_kind {
    uint8_t choice;
    const char* name;
    void (*apply)(input_bytes part);
};
constexpr part_kind parts[] = {
    {'f', "FilterConfig", apply_filters},
    {'s', "Settings", apply_limits},
    {'a', "RunActions", [](input_bytes) { run_actions(); }},
    {'o', "RunActionsOnce", act_once},
};

}  // namespace
}  // namespace kivd

int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    using namespace kivd;
    input_bytes input = {data, size};
    const auto* const part = std::ranges::find(parts, take_choice(input), &part_kind::choice);
    if (part == std::end(parts)) return -1;
    clear_files();
    const started_modules modules;
    store_config_part("kivd", part->name, input);
    part->apply(input);
    return 0;
}
