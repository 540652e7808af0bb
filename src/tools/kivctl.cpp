// kivctl: talks to a running kivd from the command line.

#include <CLI/CLI.hpp>
#include <algorithm>
#include <cerrno>
#include <charconv>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <exception>
#include <limits>
#include <memory>
#include <string>

#include "kiv.h"
#include "tools/kivctl_io.h"
#include "util/unique_fd.h"

namespace kivd {
namespace {

enum exit_status : int {
    status_done = 0,
    status_refused = 1,  // or the data is bad
    status_usage = 2,
    status_unreachable = 3,  // or not in time
};

// What the command line gave; each command uses a few.
struct given {
    std::string package;
    std::string name;
    std::string value;
    std::string payload;
    std::string file;
    std::string amount = "1";
    std::string state;
    std::string number;
    std::string id;
    std::string old_id;
};

struct argument {
    const char* name = nullptr;  // an option when it starts with dashes
    std::string given::*target = nullptr;
    const char* description = nullptr;
    bool is_required = false;
    std::string (*check)(const std::string&) =
        nullptr;  // a complaint, empty when all is well; or null
};

struct command {
    const char* group;  // null for none
    const char* name;
    const char* description;
    argument arguments[4];                  // the last ones nameless
    int (*run)(kiv_handle*, const given&);  // the exit status, or what libkiv gives when it fails
};

// How results of libkiv are told; {base} and {timeout} stand for the options.
struct explanation {
    int error;
    exit_status status;
    const char* text;
};

// What the daemon takes from its directory; a request carries less.
constexpr size_t config_file_size_max = 204'799;

constexpr char no_daemon[] =
    "no daemon listens in {base}; check that kivd runs and that --base is the directory it was "
    "started with";

constexpr explanation explanations[] = {
    {ENOENT, status_unreachable, no_daemon},
    {ECONNREFUSED, status_unreachable, no_daemon},
    {EACCES, status_unreachable,
     "no permission to reach the daemon in {base}; check the modes of that directory and of the "
     "sockets in it"},
    {ETIMEDOUT, status_unreachable,
     "the daemon in {base} has not answered within {timeout} ms; it may be busy or stopped, and "
     "--timeout lets it take longer"},
    {EAGAIN, status_unreachable,
     "the queue of the daemon in {base} stayed full for {timeout} ms; it may be busy or stopped, "
     "and --timeout lets it take longer"},
    {ECONNRESET, status_unreachable,
     "the daemon in {base} gave no answer; it may have ended, or not know the request"},
    {EPROTO, status_refused, "the daemon in {base} gave an answer that makes no sense"},
    {EPERM, status_refused,
     "the daemon refused the request; it takes it from its own user, from root and from members "
     "of the group kiv_private"},
    {EINVAL, status_refused,
     "a package, name or group id is empty or holds a blank, or a value is empty"},
    {EMSGSIZE, status_refused,
     "the request is too long; a package and a name may have 256 bytes together, a payload 30720, "
     "and the whole request 31176"},
    {ERANGE, status_refused,
     "the number is beyond what a counter holds, -2147483648 to 2147483647"},
    {ENAMETOOLONG, status_refused, "the path {base} is too long for that of a socket"},
};

// `text` as a number, cut to the range of the type; false when it isn't one.
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

// The daemon reads anything that isn't a number as 0, and removes every report then.
std::string check_report_number(const std::string& text) {
    if (text == "all") return "";
    int64_t number = 0;
    const bool is_number = parse_number(text, number);
    if (is_number && number >= 1 && number <= std::numeric_limits<int32_t>::max()) return "";
    return "\"" + text + "\" is neither a report number, 1 or more, nor \"all\"";
}

std::string check_directory(const std::string& text) {
    return text.empty() ? "the directory has no name" : "";
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

// `result` is that of handing over a configuration.
int tell_whether_taken(int result, const char* when_not) {
    if (result < 0) return result;
    if (result == 0) throw failure(when_not);
    print_line("taken");
    return status_done;
}

int install_config(kiv_handle* daemon, const given& g) {
    const std::string config = read_source(g.file, config_file_size_max, "a configuration");
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

// clang-format off
constexpr argument package = {"PACKAGE", &given::package, "First half of the probe's id", true};
constexpr argument name = {"NAME", &given::name, "Second half of the probe's id", true};
constexpr argument group_id = {"ID", &given::id, "A group id", true};

constexpr struct {
    const char* name;
    const char* description;
} groups[] = {
    {"config",  "Hand over a configuration, or look at the one in force"},
    {"counter", "Set a counter or add to it"},
    {"group",   "Change the group ids that every report carries"},
};

constexpr command commands[] = {
    {nullptr, "event", "Add an event; its payload is empty unless given", {package, name,
         {"PAYLOAD", &given::payload, "The payload; write -- before one that starts with a dash"},
         {"--file", &given::file, "Take the payload from a file, or with - from standard input"}},
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
    {nullptr, "collection", "Switch data collection on or off", {
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
};
// clang-format on

struct options {
    std::string base = KIV_DEFAULT_DIRECTORY;
    unsigned timeout_ms = 2000;
    const command* chosen = nullptr;
    given arguments;
};

void add_command(CLI::App& parent, const command& added, options& chosen) {
    CLI::App* subcommand = parent.add_subcommand(added.name, added.description);
    subcommand->callback([&added, &chosen] { chosen.chosen = &added; });
    for (const argument& a : added.arguments) {
        if (a.name == nullptr) break;
        CLI::Option* option =
            subcommand->add_option(a.name, chosen.arguments.*a.target, a.description);
        option->required(a.is_required);
        option->option_text(a.is_required || *a.name == '-' ? " " : "[optional]");
        if (a.check != nullptr) option->check(a.check);
    }
}

void set_up(CLI::App& app, options& chosen) {
    app.description("Sends probe data and requests to a running kivd.");
    app.footer(
        "Exit status: 0 done, 1 refused or bad data, 2 wrong usage,\n"
        "             3 daemon not reachable or not in time");
    app.require_subcommand(1);
    app.add_option("--base", chosen.base, "The daemon's directory, where its sockets are")
        ->option_text("DIR [" + chosen.base + "]")
        ->check(check_directory)
        ->take_last();
    app.add_option("--timeout", chosen.timeout_ms,
                   "How long to wait for the daemon, in milliseconds")
        ->option_text("MS [" + std::to_string(chosen.timeout_ms) + "]")
        ->check(CLI::Range(1, 86'400'000))
        ->take_last();
    for (const auto& group : groups) {
        app.add_subcommand(group.name, group.description)->require_subcommand(1);
    }
    for (const command& c : commands) {
        add_command(c.group == nullptr ? app : *app.get_subcommand(c.group), c, chosen);
    }
    CLI::App* event = app.get_subcommand("event");
    event->get_option("--file")->option_text("FILE")->excludes(event->get_option("PAYLOAD"));
}

std::string replace(std::string text, const std::string& from, const std::string& to) {
    const size_t position = text.find(from);
    if (position != std::string::npos) text.replace(position, from.size(), to);
    return text;
}

// Tells what went wrong when libkiv failed; gives the exit status.
int conclude(int result, const options& chosen) {
    if (result >= 0) return result;
    const auto* found = std::ranges::find(explanations, -result, &explanation::error);
    if (found == std::end(explanations)) {
        fprintf(stderr, "kivctl: cannot talk to the daemon in %s: %s\n", chosen.base.c_str(),
                strerror(-result));
        return status_unreachable;
    }
    std::string text = replace(found->text, "{timeout}", std::to_string(chosen.timeout_ms));
    text = replace(text, "{base}", chosen.base);
    fprintf(stderr, "kivctl: %s\n", text.c_str());
    return found->status;
}

struct handle_closer {
    void operator()(kiv_handle* handle) const noexcept { kiv_destroy(handle); }
};

int run(const options& chosen) {
    const std::unique_ptr<kiv_handle, handle_closer> daemon(
        kiv_create_from_path(chosen.base.c_str()));
    if (!daemon) return conclude(-errno, chosen);
    kiv_set_wait(daemon.get(), chosen.timeout_ms);
    kiv_set_timeout(daemon.get(), chosen.timeout_ms);
    return conclude(chosen.chosen->run(daemon.get(), chosen.arguments), chosen);
}

int parse_and_run(int argc, char** argv) {
    CLI::App app;
    options chosen;
    set_up(app, chosen);
    try {
        app.parse(argc, argv);
    } catch (const CLI::Success& help) {
        return app.exit(help);
    } catch (const CLI::RequiredError& error) {
        // a mistyped command counts as a missing one, but is the better thing to name
        const auto unknown = app.remaining(true);
        const std::string text =
            unknown.empty() ? error.what() : "unexpected \"" + unknown.front() + "\"";
        fprintf(stderr, "kivctl: %s (see kivctl --help)\n", text.c_str());
        return status_usage;
    } catch (const CLI::ParseError& error) {
        fprintf(stderr, "kivctl: %s (see kivctl --help)\n", error.what());
        return status_usage;
    }
    return run(chosen);
}

}  // namespace
}  // namespace kivd

int main(int argc, char** argv) {
    try {
        return kivd::parse_and_run(argc, argv);
    } catch (const std::exception& error) {
        fprintf(stderr, "kivctl: %s\n", error.what());
        return kivd::status_refused;
    }
}
