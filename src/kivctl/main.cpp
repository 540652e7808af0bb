// kivctl: talks to a running kivd from the command line.

#include <CLI/CLI.hpp>
#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <exception>
#include <memory>
#include <string>

#include "kiv.h"
#include "kivctl/commands.h"
#include "kivctl/io.h"
#include "util/releaser.h"

namespace kivd {
namespace {

// What is said about errors of libkiv; {base} and {timeout} stand for the options.
struct explanation {
    int error;
    exit_status status;
    const char* text;
};

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

struct options {
    const command* chosen = nullptr;
    given arguments;
};

std::string check_directory(const std::string& text) {
    return text.empty() ? "the directory has no name" : "";
}

void add_command(CLI::App& parent, const command& added, options& chosen) {
    CLI::App* subcommand = parent.add_subcommand(added.name, added.description);
    subcommand->callback([&added, &chosen] { chosen.chosen = &added; });
    for (const argument& a : added.arguments) {
        if (a.name == nullptr) break;
        if (a.flag != nullptr) {
            subcommand->add_flag(a.name, chosen.arguments.*a.flag, a.description);
            continue;
        }
        CLI::Option* option =
            subcommand->add_option(a.name, chosen.arguments.*a.target, a.description);
        option->required(a.is_required);
        option->option_text(a.is_required ? " " : "[optional]");
        if (a.value_name != nullptr) option->option_text(a.value_name);
        if (a.check != nullptr) option->check(a.check);
    }
}

void set_up(CLI::App& app, options& chosen) {
    app.description("Sends probe data and requests to a running kivd.");
    app.footer(
        "Exit status: 0 done, 1 refused or bad data, 2 wrong usage,\n"
        "             3 daemon not reachable or not in time");
    app.require_subcommand(1);
    app.add_option("--base", chosen.arguments.base, "The daemon's directory, where its sockets are")
        ->option_text("DIR [" + chosen.arguments.base + "]")
        ->check(check_directory)
        ->take_last();
    app.add_option("--timeout", chosen.arguments.timeout_ms,
                   "How long to wait for the daemon, in milliseconds")
        ->option_text("MS [" + std::to_string(chosen.arguments.timeout_ms) + "]")
        ->check(CLI::Range(1, 86'400'000))
        ->take_last();
    for (const command_group& group : kivctl_groups()) {
        app.add_subcommand(group.name, group.description)->require_subcommand(1);
    }
    for (const command& c : kivctl_commands()) {
        add_command(c.group == nullptr ? app : *app.get_subcommand(c.group), c, chosen);
    }
    CLI::App* event = app.get_subcommand("event");
    event->get_option("--file")->excludes(event->get_option("PAYLOAD"));
}

std::string replace(std::string text, const std::string& from, const std::string& to) {
    const size_t position = text.find(from);
    if (position != std::string::npos) text.replace(position, from.size(), to);
    return text;
}

// Returns the exit status, after saying what went wrong when libkiv failed.
int conclude(int result, const given& arguments) {
    if (result >= 0) return result;
    const auto* found = std::ranges::find(explanations, -result, &explanation::error);
    if (found == std::end(explanations)) {
        fprintf(stderr, "kivctl: cannot talk to the daemon in %s: %s\n", arguments.base.c_str(),
                strerror(-result));
        return status_unreachable;
    }
    std::string text = replace(found->text, "{timeout}", std::to_string(arguments.timeout_ms));
    text = replace(text, "{base}", arguments.base);
    fprintf(stderr, "kivctl: %s\n", text.c_str());
    return found->status;
}

int run(const command& chosen, const given& arguments) {
    if (chosen.handle == handle_use::none) return chosen.run(nullptr, arguments);
    const std::unique_ptr<kiv_handle, releaser<kiv_destroy>> daemon(
        kiv_create_from_path(arguments.base.c_str()));
    if (!daemon) return conclude(-errno, arguments);
    kiv_set_wait(daemon.get(), arguments.timeout_ms);
    kiv_set_timeout(daemon.get(), arguments.timeout_ms);
    return conclude(chosen.run(daemon.get(), arguments), arguments);
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
        // a mistyped command counts as a missing one, but naming it helps more
        const auto unknown = app.remaining(true);
        const std::string text =
            unknown.empty() ? error.what() : "unexpected \"" + unknown.front() + "\"";
        fprintf(stderr, "kivctl: %s (see kivctl --help)\n", text.c_str());
        return status_usage;
    } catch (const CLI::ParseError& error) {
        fprintf(stderr, "kivctl: %s (see kivctl --help)\n", error.what());
        return status_usage;
    }
    return run(*chosen.chosen, chosen.arguments);
}

}  // namespace
}  // namespace kivd

int main(int argc, char** argv) {
    try {
        return kivd::parse_and_run(argc, argv);
    } catch (const kivd::failure& error) {
        fprintf(stderr, "kivctl: %s\n", error.what());
        return error.status;
    } catch (const std::exception& error) {
        fprintf(stderr, "kivctl: %s\n", error.what());
        return kivd::status_refused;
    }
}
