#include "kivctl/daemon_state.h"

#include <sys/stat.h>
#include <sys/statfs.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <climits>
#include <filesystem>
#include <string_view>

#include "config.pb-c.h"
#include "config/limits.h"
#include "daemon/option_names.h"
#include "diag/diag_store.h"
#include "format/config_file.h"
#include "format/protobuf_message.h"
#include "format/report_name.h"
#include "kivctl/io.h"
#include "report/output_dir.h"
#include "runtime/daemon_error.h"
#include "settings.pb-c.h"
#include "util/bytes.h"
#include "util/directory.h"
#include "util/file_io.h"
#include "util/numbers.h"
#include "util/paths.h"
#include "util/text_scan.h"

namespace kivd {
namespace {

constexpr size_t line_size = 256;  // as the daemon reads the file
constexpr size_t config_request_size_max = 1'000'000;

std::optional<int64_t> scan_value(const char* line, const char* key, size_t width = 0) {
    const char* const text = scan_key(line, key);
    return text != nullptr ? scan_number(text, width) : std::nullopt;
}

void read_state_line(const char* line, saved_state& state) {
    if (const auto digit = scan_value(line, "data-collection:", 1)) {
        state.is_collecting = *digit != 0;
    } else if (const auto report_size = scan_value(line, "report-max-size:")) {
        state.max_report_size = static_cast<uint32_t>(saturate_int32(*report_size));
    } else if (const auto output_size = scan_value(line, "output-dir-max-size:")) {
        state.max_output_dir_size = static_cast<uint32_t>(saturate_int32(*output_size));
    } else if (const auto number = scan_value(line, "error_nr:")) {
        state.error_nr = saturate_int32(*number);
    } else if (const auto time = scan_value(line, "error_time:")) {
        state.error_time = saturate_int32(*time);
    } else if (const char* const text = scan_key(line, "config-checksum:")) {
        const std::string_view digits = scan_word(text, line_size);
        if (parse_checksum(digits)) state.checksum = digits;
    }
}

std::optional<saved_state> read_saved_state() {
    const unique_file file = open_to_read(paths::state);
    struct stat status = {};
    if (!file || fstat(fileno(file.get()), &status) != 0) return std::nullopt;
    saved_state state;
    state.saved_at = status.st_mtime;
    state.max_report_size = default_limits.max_report_size;
    state.max_output_dir_size = default_limits.max_output_dir_size;
    char line[line_size];
    while (fgets(line, sizeof line, file.get()) != nullptr) read_state_line(line, state);
    return ferror(file.get()) == 0 ? std::optional(state) : std::nullopt;
}

std::optional<std::string> find_requested_checksum() {
    const auto text = read_if_possible(paths::config_request, config_request_size_max);
    if (!text) return std::nullopt;
    const auto request = unpack_message<Kiv__Config__ConfigRequest>(
        kiv__config__config_request__descriptor, bytes_of(*text));
    config_checksum checksum;
    if (!request || request->current_config.len != checksum.size()) return std::nullopt;
    std::copy_n(request->current_config.data, checksum.size(), checksum.begin());
    return text_of_checksum(checksum).data();
}

// A configuration without this part leaves the store as it was. Then only two signs show that it is
// off: this event, which the store wants whatever the filter says, is unwanted, or its directory is
// gone.
std::optional<bool> find_diagnostics(daemon_questions& questions) {
    const config_part_answer part = questions.own_part("RunActions");
    if (part.payload) {
        const auto actions = unpack_message<Kivd__RunActions>(kivd__run_actions__descriptor,
                                                              bytes_of(*part.payload));
        if (actions) {
            return actions->has_activate_lumora_diagnostics != 0 &&
                   actions->activate_lumora_diagnostics != 0;
        }
    }
    const auto is_wanted = questions.is_wanted("devicemonitor.powerstat", "ShutDown");
    if (is_wanted == false) return false;
    if (is_wanted && access(paths::diag_dir, F_OK) != 0 && errno == ENOENT) return false;
    return std::nullopt;
}

std::optional<uint64_t> find_partial_size() {
    struct stat status = {};
    if (stat(paths::events, &status) == 0) return static_cast<uint64_t>(status.st_size);
    // without private/ this is no daemon's directory
    if (errno != ENOENT || access(paths::private_dir, X_OK) != 0) return std::nullopt;
    return 0;
}

void add_entry(output_facts& found, std::string_view name) {
    const std::string path = paths::output_dir + std::string(name);
    struct stat status = {};
    if (lstat(path.c_str(), &status) != 0) return;  // a collector has just taken it
    found.size += static_cast<uint64_t>(status.st_size);
    if (path == paths::disable_marker) {
        found.has_marker = true;
        return;
    }
    // The daemon could not delete a report under any other name.
    const auto number = parse_report_name(name.data());
    if (!number || !S_ISREG(status.st_mode)) {
        found.bad_names.emplace_back(name);
        return;
    }
    found.lowest = found.reports == 0 ? *number : std::min(found.lowest, *number);
    found.highest = std::max(found.highest, *number);
    ++found.reports;
}

std::optional<output_facts> scan_output() {
    output_facts found;
    const bool is_complete = for_each_entry(paths::output_dir, [&found](std::string_view name) {
        if (name != paths::config_request_name) add_entry(found, name);
    });
    std::ranges::sort(found.bad_names);
    return is_complete ? std::optional(found) : std::nullopt;
}

std::optional<space_facts> find_space() {
    struct statfs status = {};
    if (statfs(paths::output_dir, &status) != 0) return std::nullopt;
    space_facts found;
    found.bytes = static_cast<uint64_t>(status.f_bsize) * status.f_bavail;
    if (status.f_files != 0) found.inodes = status.f_ffree;
    return found;
}

key_facts find_keys(const process_facts& process, const std::optional<std::string>& given,
                    const std::string& user_name) {
    key_facts found;
    std::string directory = paths::default_key_dir;
    if (given) {
        found.source = key_source::given;
        directory = *given;
    } else if (!process.arguments) {
        found.source = key_source::assumed;
    } else if (!process.arguments->key_directory) {
        found.source = key_source::usual;
    } else {
        found.source = key_source::command_line;
        directory = *process.arguments->key_directory;
        if (directory == no_encryption) {
            found.report_key = found.config_key = key_verdict::switched_off;
            return found;
        }
        // relative to where it was started, which it has left
        if (!directory.starts_with('/')) return found;
    }
    const auto user = user_name.empty() ? process.user : find_user(user_name);
    if (!user_name.empty() && !user) throw failure("there is no user \"" + user_name + "\"");
    found.report_key_path = directory + paths::report_key_name;
    found.config_key_path = directory + paths::config_key_name;
    found.report_key = check_key(found.report_key_path, key_use::seal_reports, user, process.pid);
    found.config_key =
        check_key(found.config_key_path, key_use::verify_configurations, user, process.pid);
    return found;
}

error_guard_facts find_error_guard(const saved_state& saved, bool is_test_mode) {
    error_guard_facts found;
    found.saved_at = saved.saved_at;
    found.used = std::clamp<int64_t>(saved.error_nr, 0, error_period_limit);
    const time_t interval = is_test_mode ? error_flood_interval_in_test_mode : error_flood_interval;
    const time_t end = saved.error_time + interval;
    if (found.used == error_period_limit && time(nullptr) <= end) found.suppressed_until = end;
    return found;
}

}  // namespace

bool enter_base(const std::string& base) { return chdir(base.c_str()) == 0; }

daemon_state gather_state(daemon_questions& questions,
                          const std::optional<std::string>& key_directory,
                          const std::string& user) {
    daemon_state state;
    state.process = find_daemon_process();
    const auto start = std::chrono::steady_clock::now();
    state.answer = questions.is_alive();
    if (state.answer == 0) {
        const auto taken = std::chrono::steady_clock::now() - start;
        state.answer_us = std::chrono::duration_cast<std::chrono::microseconds>(taken).count();
        state.has_diagnostics = find_diagnostics(questions);
    }
    state.partial_size = find_partial_size();
    state.output = scan_output();
    state.space = find_space();
    state.keys = find_keys(state.process, key_directory, user);
    state.saved = read_saved_state();
    if (!state.saved) {
        state.checksum = find_requested_checksum();
        return state;
    }
    state.checksum = state.saved->checksum ? state.saved->checksum : find_requested_checksum();
    state.output_budget =
        output_size_budget(state.saved->max_output_dir_size, state.saved->max_report_size);
    if (state.has_diagnostics) {
        state.space_needed = compaction_space(state.saved->max_report_size) +
                             (*state.has_diagnostics ? diag_reserved_space : 0);
    }
    const auto& arguments = state.process.arguments;
    state.error_guard = find_error_guard(*state.saved, arguments && arguments->is_test_mode);
    return state;
}

}  // namespace kivd
