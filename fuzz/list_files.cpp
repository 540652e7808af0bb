// List files. The first byte of the input says which one the rest is; see `kinds`. What a start
// reads from it, the next save writes, and from then on it stays the same.
#include <algorithm>
#include <array>
#include <optional>

#include "config/config_parts.h"
#include "config/filters.h"
#include "format/probe_key.h"
#include "fuzz/harness.h"
#include "store/counters.h"
#include "store/static_data.h"
#include "util/clock.h"
#include "util/paths.h"

namespace kivd {
namespace {

constexpr std::string_view terminator("\0\0\n", 3);

// A save writes nothing unless something changed, so each changes an entry, at always the same
// time.
void stop_clock() { set_test_clock(2000000000); }

void save_counters() {
    stop_clock();
    counters_update("fuzz", "touched", 0, counter_mode::increment, 0);
    stop_clock();
    counters_save();
}

void save_static_data() {
    static_data_set("fuzz", "touched", "before", 0);
    stop_clock();
    static_data_set("fuzz", "touched", "after", 0);
    stop_clock();
    static_data_save();
}

struct list_kind {
    uint8_t choice;
    const char* path;
    void (*save)();  // null for a list that only a configuration makes anew
};
constexpr list_kind kinds[] = {
    {'c', paths::counters, save_counters},
    {'s', paths::static_data, save_static_data},
    {'l', paths::config_list, [] { require(save_config_list(), "a save failed"); }},
    {'f', paths::event_filter, nullptr},
};

// Whether the records of a saved file stand in their order, as they do unless it came from a file
// in which they didn't: then what is in the list may not be found, and be added once more.
bool is_in_order(std::string_view file) {
    const char* previous = nullptr;
    for (size_t end = 0; (end = file.find(terminator)) != std::string_view::npos;) {
        const auto key_of = [](const char* record) {
            return probe_key{record, record + std::string_view(record).size() + 1};
        };
        if (previous != nullptr) {
            const probe_key before = key_of(previous);
            const probe_key after = key_of(file.data());
            if (compare_probes(before, after) >= 0) return false;
        }
        previous = file.data();
        file.remove_prefix(end + terminator.size());
    }
    return file.empty();
}

std::string load_and_save(const list_kind& kind) {
    enable_test_mode();
    const started_modules modules;
    kind.save();
    return read_file(kind.path);
}

bool load_and_match() {
    enable_test_mode();
    const started_modules modules;
    (void)filter_match(filter_kind::events, "", "");
    return filter_match(filter_kind::events, "shop", "order");
}

}  // namespace
}  // namespace kivd

int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    using namespace kivd;
    input_bytes input = {data, size};
    const auto* const kind = std::ranges::find(kinds, take_choice(input), &list_kind::choice);
    if (kind == std::end(kinds)) return -1;
    clear_files();
    write_file(kind->path, input);
    if (kind->save == nullptr) {
        const bool matched = load_and_match();
        require(load_and_match() == matched, "a filter changes its mind at a restart");
        return 0;
    }
    const std::string saved = load_and_save(*kind);
    // Numbers are written as what they were read as, which can have more digits: a record that was
    // nearly of the largest size may have outgrown it.
    if (input.size() > 900 || !is_in_order(saved)) return 0;
    require(load_and_save(*kind) == saved, "a restart changes the list");

    // Cut anywhere, as by a crash of the system, it costs no record that is whole.
    std::string_view cut = std::string_view(saved).substr(0, size * 31 % (saved.size() + 1));
    write_file(kind->path, {reinterpret_cast<const uint8_t*>(cut.data()), cut.size()});
    const std::string mended = load_and_save(*kind);
    for (size_t end = 0; (end = cut.find(terminator)) != std::string_view::npos;) {
        const std::string_view record = cut.substr(0, end + terminator.size());
        require(mended.find(record) != std::string::npos, "a record before the cut is lost");
        cut.remove_prefix(record.size());
    }
    return 0;
}
