#include "kivctl/commands.h"

#include <cerrno>
#include <charconv>
#include <cstdint>
#include <limits>

#include "format/config_file.h"
#include "kivctl/check_command.h"
#include "kivctl/files.h"
#include "kivctl/io.h"
#include "kivctl/status_command.h"
#include "kivctl/watch_command.h"
#include "util/unique_fd.h"

namespace kivd {
namespace {

// Reads `text` as a number, saturated to the range of the type. False when it isn't a number.
bool parse_number(const std::string& text, int64_t& number) {
    const char* end = text.data() + text.size();
    const auto parsed = std::from_chars(text.data(), end, number);
    if (parsed.ec == std::errc::result_out_of_range) {
        using range = std::numeric_limits<int64_t>;
        number = text.front() == '-' ? range::min() : range::max();
    }
    return parsed.ec != std::errc::invalid_argument && parsed.ptr == end;
}

std::string check_number(const std::string& text) {
    int64_t number = 0;
    return parse_number(text, number) ? "" : "\"" + text + "\" is not a whole number";
}

int64_t to_number(const std::string& checked_text) {
    int64_t number = 0;
    (void)parse_number(checked_text, number);
    return number;
}

bool is_file_number(const std::string& text) {
    int64_t number = 0;
    const bool is_number = parse_number(text, number);
    return is_number && number >= 1 && number <= std::numeric_limits<int32_t>::max();
}

// The daemon would read anything that isn't a number as 0, and remove every report.
std::string check_report_number(const std::string& text) {
    if (text == "all" || is_file_number(text)) return "";
    return "\"" + text + "\" is neither a report number, 1 or more, nor \"all\"";
}

std::string check_file_number(const std::string& text) {
    return is_file_number(text) ? "" : "\"" + text + "\" is not a file number, 1 or more";
}

std::string check_state(const std::string& text) {
    return text == "on" || text == "off" ? "" : "\"" + text + "\" is neither \"on\" nor \"off\"";
}

int add_event(kiv_handle* daemon, const given& g) {
    const std::string payload =
        g.file.empty() ? g.payload : read_source(g.file, KIV_PAYLOAD_MAX, "a payload");
    return kiv_add_event(daemon, g.package.c_str(), g.name.c_str(), payload.data(), payload.size());
}

int show_alive(kiv_handle* daemon, const given&) {
    const int result = kiv_is_alive(daemon);
    if (result == 0) print_line("alive");
    return result;
}

int show_device_id(kiv_handle* daemon, const given&) {
    char device_id[KIV_DEVICE_ID_MAX + 1];
    const int result = kiv_get_device_id(daemon, device_id);
    if (result == 0) print_line(device_id);
    return result;
}

int remove_report(kiv_handle* daemon, const given& g) {
    const int64_t number = g.number == "all" ? 0 : to_number(g.number);
    return kiv_remove_reports(daemon, static_cast<int32_t>(number));
}

int ask_whether_wanted(kiv_handle* daemon, const given& g) {
    const int result = kiv_is_probe_active(daemon, g.package.c_str(), g.name.c_str());
    if (result < 0) return result;
    print_line(result == 1 ? "wanted" : "not wanted");
    return result == 1 ? status_done : status_refused;
}

// `result` is what libkiv returned for a configuration.
int tell_whether_taken(int result, const char* when_not) {
    if (result < 0) return result;
    if (result == 0) throw failure(when_not);
    print_line("taken");
    return status_done;
}

int install_config(kiv_handle* daemon, const given& g) {
    const std::string config = read_source(g.file, max_config_file_size, "a configuration");
    if (config.empty()) throw failure(name_source(g.file) + " is empty");
    if (config.size() > KIV_CONFIG_MAX) {
        throw failure(name_source(g.file) + " has " + std::to_string(config.size()) +
                      " bytes, but a request carries at most " + std::to_string(KIV_CONFIG_MAX) +
                      "; put it into the daemon's directory as input/config, then run "
                      "\"kivctl config announce\"");
    }
    return tell_whether_taken(kiv_install_config(daemon, config.data(), config.size()),
                              "the daemon did not take the configuration; its log says why");
}

int announce_config(kiv_handle* daemon, const given&) {
    return tell_whether_taken(kiv_announce_config(daemon),
                              "the daemon did not take a configuration; its log says why, unless "
                              "there is no input/config in its directory that it can read");
}

int print_config_part(kiv_handle* daemon, const given& g) {
    const int fd = kiv_get_config(daemon, g.package.c_str(), g.name.c_str());
    if (fd == -ENOENT) {
        throw failure("the configuration in force has no part \"" + g.name +
                      "\" of the package \"" + g.package + "\"");
    }
    if (fd < 0) return fd;
    const unique_fd part(fd);
    print_content(part.get());
    return status_done;
}

int watch(kiv_handle* /*none*/, const given& g) {
    return run_watch({g.host, g.package, g.is_raw, g.base, g.timeout_ms});
}

// clang-format off
constexpr argument package = {"PACKAGE", &given::package, "First half of the probe's id", true};
constexpr argument name = {"NAME", &given::name, "Second half of the probe's id", true};
constexpr argument group_id = {"ID", &given::id, "A group id", true};

constexpr argument as_json = {"--json", nullptr, "Print JSON", false, nullptr, nullptr,
                              &given::is_json};

constexpr command_group groups[] = {
    {"config",  "Hand over a configuration, or look at the one in force"},
    {"counter", "Set a counter or add to it"},
    {"files",   "Look at the diagnostics files"},
    {"group",   "Change the group ids that every report carries"},
};

constexpr command commands[] = {
    {nullptr, "event", "Add an event; its payload is empty unless given", {package, name,
         {"PAYLOAD", &given::payload, "The payload; write -- before one that starts with a dash"},
         {"--file", &given::file, "Take the payload from a file, or with - from standard input",
          false, nullptr, "FILE"}},
     add_event},
    {"counter", "set", "Give a counter a value", {package, name,
         {"VALUE", &given::value, "The new value", true, check_number}},
     [](kiv_handle* daemon, const given& g) {
         return kiv_set_counter(daemon, g.package.c_str(), g.name.c_str(), to_number(g.value));
     }},
    {"counter", "inc", "Add to a counter", {package, name,
         {"AMOUNT", &given::amount, "What to add; may be negative", false, check_number}},
     [](kiv_handle* daemon, const given& g) {
         return kiv_inc_counter(daemon, g.package.c_str(), g.name.c_str(), to_number(g.amount));
     }},
    {nullptr, "static", "Set static data", {package, name,
         {"VALUE", &given::value, "The new value; may hold blanks", true}},
     [](kiv_handle* daemon, const given& g) {
         return kiv_set_static_data(daemon, g.package.c_str(), g.name.c_str(), g.value.c_str());
     }},
    {nullptr, "alive", "Ask whether the daemon answers", {}, show_alive},
    {nullptr, "flush", "Make a report now (nothing happens while data collection is off)", {},
     [](kiv_handle* daemon, const given&) { return kiv_flush(daemon); }},
    {nullptr, "save", "Save counters and static data now", {},
     [](kiv_handle* daemon, const given&) { return kiv_save(daemon); }},
    {nullptr, "device-id", "Print the device id", {}, show_device_id},
    {nullptr, "wanted", "Ask whether an event is wanted; the exit status is 1 when it is not",
     {package, name}, ask_whether_wanted},
    {"config", "install", "Hand a configuration file to the daemon and have it taken", {
         {"FILE", &given::file, "The file, or - for standard input", true}},
     install_config},
    {"config", "announce", "Have the file input/config of the daemon's directory taken", {},
     announce_config},
    {"config", "get", "Print a part of the configuration in force", {
         {"PACKAGE", &given::package, "The part's package", true},
         {"NAME", &given::name, "The part's name", true}},
     print_config_part},
    {nullptr, "collection",
     "Switch data collection and diagnostics on or off; off deletes the diagnostics files", {
         {"STATE", &given::state, "on or off", true, check_state}},
     [](kiv_handle* daemon, const given& g) {
         return kiv_set_data_collection(daemon, g.state == "on" ? 1 : 0);
     }},
    {nullptr, "remove-report", "Remove one report or all of them", {
         {"NUMBER", &given::number, "The report's number, or all", true, check_report_number}},
     remove_report},
    {"group", "add", "Add a group id", {group_id},
     [](kiv_handle* daemon, const given& g) { return kiv_set_group_id(daemon, g.id.c_str()); }},
    {"group", "delete", "Delete a group id", {group_id},
     [](kiv_handle* daemon, const given& g) { return kiv_delete_group_id(daemon, g.id.c_str()); }},
    {"group", "replace", "Put one group id in the place of another", {
         {"NEW", &given::id, "The id to put in", true},
         {"OLD", &given::old_id, "The id to take out", true}},
     [](kiv_handle* daemon, const given& g) {
         return kiv_replace_group_id(daemon, g.id.c_str(), g.old_id.c_str());
     }},
    {"files", "list", "List the number and the size of each file", {},
     [](kiv_handle* daemon, const given& g) { return list_files(daemon, g.timeout_ms); }},
    {"files", "get", "Print a file; kivtool report shows what is in it", {
         {"NUMBER", &given::number, "The file's number", true, check_file_number},
         {"-o,--output", &given::output, "Write it to a file instead", false, nullptr, "FILE"}},
     [](kiv_handle* daemon, const given& g) {
         return get_file(daemon, static_cast<int32_t>(to_number(g.number)), g.output);
     }},
    {nullptr, "status", "Show how the daemon stands; the exit status is 3 when it does not answer", {
         as_json},
     [](kiv_handle*, const given& g) { return run_status({g.base, g.timeout_ms, g.is_json}); },
     handle_use::none},
    {nullptr, "check", "Say what is weak; the exit status is 1 when there is something", {as_json,
         {"--keys", &given::key_directory, "Where the keys ought to be, instead of where the daemon "
          "looks for them", false, nullptr, "DIR"},
         {"--user", &given::user, "Who ought to read the keys, instead of the daemon's user", false,
          nullptr, "NAME"}},
     [](kiv_handle*, const given& g) {
         return run_check({g.base, g.timeout_ms, g.is_json, g.key_directory, g.user});
     },
     handle_use::none},
    {nullptr, "watch", "Show the requests to a daemon that was started with -d, as it handles them", {
         {"--host", &given::host, "Where the daemon runs", false, nullptr, "ADDRESS [127.0.0.1]"},
         {"--package", &given::package, "Show the requests of that package only", false, nullptr,
          "NAME"},
         {"--raw", nullptr, "Write the frames as they come", false, nullptr, nullptr,
          &given::is_raw}},
     watch, handle_use::none},
};
// clang-format on

}  // namespace

std::span<const command_group> kivctl_groups() { return groups; }

std::span<const command> kivctl_commands() { return commands; }

}  // namespace kivd
