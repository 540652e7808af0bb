#include "kivctl/directory_faults.h"

#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <functional>
#include <string_view>

#include "config.pb-c.h"
#include "format/list_record.h"
#include "format/protobuf_message.h"
#include "kivctl/io.h"
#include "util/bytes.h"
#include "util/directory.h"
#include "util/paths.h"

namespace kivd {
namespace {

using std::string_view;

constexpr size_t list_size_max = list_record_size_max * (list_records_max + 1);

enum class maker : bool { daemon, worker };

// A file that exists only while something is being made of it.
struct temporary {
    std::string path;
    ino_t inode;
    int64_t changed_s, changed_ns;
    maker made_by;

    bool operator==(const temporary&) const = default;
};

std::optional<maker> find_maker(string_view path) {
    if (path.starts_with(paths::flushed_data) || path == paths::diag_compressed) {
        return maker::worker;
    }
    const string_view name = path.substr(sizeof paths::private_dir - 1);
    const bool is_daemons =
        name.ends_with("_") || name.ends_with("_tmp") || name.starts_with("new_config.");
    return is_daemons ? std::optional(maker::daemon) : std::nullopt;
}

std::optional<std::vector<temporary>> list_temporaries() {
    std::vector<temporary> found;
    const bool is_complete = for_each_entry(paths::private_dir, [&found](string_view name) {
        const std::string path = paths::private_dir + std::string(name);
        const auto made_by = find_maker(path);
        struct stat status = {};
        if (!made_by || lstat(path.c_str(), &status) != 0) return;
        found.push_back(
            {path, status.st_ino, status.st_mtim.tv_sec, status.st_mtim.tv_nsec, *made_by});
    });
    if (!is_complete) return std::nullopt;
    std::ranges::sort(found, {}, &temporary::path);
    return found;
}

// Empty when the daemon can read all of it.
std::string find_list_fault(string_view content, bool is_filter) {
    size_t records = 0;
    for (; content.size() >= list_record_end.size() && records < list_records_max; ++records) {
        const auto record = first_list_record(content);
        if (!record) {
            return "record " + std::to_string(records + 1) + " has more than " +
                   std::to_string(list_record_size_max) + " bytes or no end";
        }
        content.remove_prefix(record->size() + list_record_end.size());
    }
    // the daemon treats a filter with exactly that many as cut short
    const bool is_full = records == list_records_max;
    if (is_full && (is_filter || content.size() >= list_record_end.size())) {
        return "there are more than " + std::to_string(list_records_max - (is_filter ? 1 : 0)) +
               " records";
    }
    return "";
}

// Whether a filter with these records keeps every probe.
bool accepts_everything(string_view content) {
    constexpr string_view marker("__type\0exclude", 14);
    bool is_exclude = false, has_items = false, has_all = false;
    while (const auto record = first_list_record(content)) {
        const bool is_marker = *record == marker;
        is_exclude = is_exclude || is_marker;
        has_items = has_items || !is_marker;
        has_all = has_all || content.starts_with('*');
        content.remove_prefix(record->size() + list_record_end.size());
    }
    return is_exclude ? !has_items : has_all;
}

struct list_file {
    const char* path;
    bool is_filter;
};
constexpr list_file list_files[] = {
    {paths::counters, false},    {paths::static_data, false},   {paths::config_list, false},
    {paths::event_filter, true}, {paths::counter_filter, true}, {paths::static_data_filter, true},
};

using filter_config = Kiv__Config__FilterConfig;
struct filter_file {
    const char* kind;
    const char* path;
    Kiv__Config__Filter* filter_config::*field;
};
constexpr filter_file filter_files[] = {
    {"event_filter", paths::event_filter, &filter_config::event_filter},
    {"counter_filter", paths::counter_filter, &filter_config::counter_filter},
    {"staticdata_filter", paths::static_data_filter, &filter_config::staticdata_filter},
};

// Nothing when the file cannot be read; a missing one is empty, and `is_missing` is set.
std::optional<std::string> read_list(const char* path, bool& is_missing) {
    struct stat status = {};
    is_missing = stat(path, &status) != 0 && errno == ENOENT;
    return is_missing ? std::string() : read_if_possible(path, list_size_max);
}

}  // namespace

left_files find_left_files(daemon_questions& questions, const process_facts& process) {
    const auto before = list_temporaries();
    (void)questions.is_alive();
    const auto is_worked_on = has_worker(process);
    const auto after = list_temporaries();
    if (!before || !after) return {};
    left_files found = {std::vector<std::string>(), std::vector<std::string>()};
    for (const temporary& each : *after) {
        if (std::ranges::find(*before, each) == before->end()) continue;
        fault_list& list = each.path == paths::flushed_data ? found.unsent : found.temporary;
        if (each.made_by == maker::worker && !is_worked_on) {
            list.reset();
        } else if (list && (each.made_by == maker::daemon || is_worked_on == false)) {
            list->push_back(each.path);
        }
    }
    return found;
}

fault_list find_list_faults() {
    std::vector<std::string> found;
    for (const auto& [path, is_filter] : list_files) {
        bool is_missing = false;
        const auto content = read_list(path, is_missing);
        if (!content) return std::nullopt;
        const std::string fault = find_list_fault(*content, is_filter);
        if (!fault.empty()) found.push_back(std::string(path) + ": " + fault);
    }
    return found;
}

fault_list find_filter_faults(daemon_questions& questions) {
    const config_part_answer part = questions.own_part("FilterConfig");
    if (!part.is_known) return std::nullopt;
    std::vector<std::string> found;
    if (!part.payload) return found;
    const auto config = unpack_message<Kiv__Config__FilterConfig>(
        kiv__config__filter_config__descriptor, bytes_of(*part.payload));
    if (!config) {
        found.emplace_back("the part kivd:FilterConfig in force cannot be decoded");
        return found;
    }
    for (const auto& [kind, path, field] : filter_files) {
        if (config.get()->*field == nullptr) continue;
        bool is_missing = false;
        const auto content = read_list(path, is_missing);
        if (!content) return std::nullopt;
        if (is_missing) {
            found.push_back(std::string("the configuration has an ") + kind + ", but " + path +
                            " is missing");
        } else if (accepts_everything(*content)) {
            found.push_back(std::string("the ") + kind + " in " + path + " leaves nothing out");
        }
    }
    return found;
}

fault_list find_socket_faults() {
    constexpr mode_t right_mode = 0622;
    std::vector<std::string> found;
    for (const char* name :
         {paths::datagram_socket, paths::sequenced_packet_socket, paths::stream_socket}) {
        struct stat status = {};
        if (lstat(name, &status) != 0) {
            if (errno != ENOENT) return std::nullopt;
            found.push_back(std::string(name) + " is missing");
        } else if (!S_ISSOCK(status.st_mode)) {
            found.push_back(std::string(name) + " is no socket");
        } else if ((status.st_mode & 07777) != right_mode) {
            char text[80];
            snprintf(text, sizeof text, "%s has mode %04o instead of %04o", name,
                     status.st_mode & 07777, right_mode);
            found.emplace_back(text);
        }
    }
    return found;
}

}  // namespace kivd
