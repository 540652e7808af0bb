// kivtool: shows what kivd leaves on disk and makes its configuration files. Needs no running
// daemon.
#include <google/protobuf/stubs/logging.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <exception>
#include <iostream>
#include <optional>
#include <string>
#include <vector>

#include "kivtool/config/config_build.h"
#include "kivtool/config/config_lint.h"
#include "kivtool/config/config_show.h"
#include "kivtool/report/report_command.h"

namespace {
constexpr int wrong_usage = 2;

struct report_given {
    std::vector<std::string> paths;
    kivd::report_options options;
};

constexpr struct {
    const char *name, *description;
    kivd::report_format format;
} report_formats[] = {
    {"text", "As protobuf text", kivd::report_format::text},
    {"json", "One JSON document for each file", kivd::report_format::json},
    {"jsonl", "One JSON object for each record, a line each", kivd::report_format::jsonl},
    {"csv", "A line of comma-separated values for each record", kivd::report_format::csv},
    {"summary", "A few lines for people", kivd::report_format::summary},
};

CLI::Option* add_report_arguments(CLI::App& report, report_given& given) {
    report.add_option("--key", given.options.key_path,
                      "Private key (PEM) that opens sealed reports");
    return report.add_option(
        "PATH", given.paths,
        "Files to read, directories whose reports to read, - for standard input");
}

CLI::App* add_report(CLI::App& app, report_given& given) {
    CLI::App* report = app.add_subcommand(
        "report",
        "Shows reports, unfinished ones (private/events) and diagnostics files; as text, if no "
        "other form is asked for");
    add_report_arguments(*report, given);
    report->require_subcommand(0, 1);
    for (const auto& format : report_formats) {
        CLI::App* sub = report->add_subcommand(format.name, format.description);
        add_report_arguments(*sub, given)->required();
        sub->callback([&given, &format] { given.options.format = format.format; });
    }
    report->final_callback([&given] {
        if (given.paths.empty()) throw CLI::RequiredError("PATH");
    });
    return report;
}

int run_report(report_given& given) {
    const bool is_shown_as_it_comes = given.options.format != kivd::report_format::summary;
    given.options.show_progress =
        isatty(STDERR_FILENO) != 0 && !(is_shown_as_it_comes && isatty(STDOUT_FILENO) != 0);
    return kivd::run_report_command(given.paths, given.options, std::cout, std::cerr);
}

struct build_given {
    std::vector<std::string> parts;
    kivd::config_build_options options;
};

std::string check_part(const std::string& argument) {
    return kivd::read_part_argument(argument) ? "" : argument + " is not PACKAGE:NAME=FILE";
}

CLI::App* add_build(CLI::App& config, build_given& given) {
    CLI::App* build = config.add_subcommand("build", "Makes a configuration file");
    build->add_option("-o,--output", given.options.output_path, "File to make")->required();
    build->add_option("--sign", given.options.key_path, "Private key (PEM) to sign with");
    build->add_flag("--no-lint", given.options.no_lint,
                    "Don't look for what the daemon would refuse, and don't refuse it");
    build
        ->add_option("PACKAGE:NAME=FILE", given.parts,
                     "A part and the file with its payload; for FilterConfig, Settings, RunActions "
                     "and RunActionsOnce of package kivd, the file is protobuf text")
        ->required()
        ->check(check_part);
    return build;
}

int run_build(const build_given& given) {
    std::vector<kivd::part_source> sources;
    for (const std::string& part : given.parts) {
        sources.push_back(*kivd::read_part_argument(part));
    }
    return kivd::run_config_build(sources, given.options, std::cerr);
}

CLI::App* add_lint(CLI::App& config, std::vector<std::string>& arguments) {
    CLI::App* lint = config.add_subcommand(
        "lint", "Finds what the daemon would refuse, or take for something else than was meant");
    lint->add_option("FILE|PACKAGE:NAME=FILE", arguments,
                     "Configuration files, each on its own, and parts, all of them together")
        ->required();
    return lint;
}

struct show_given {
    std::string path;
    std::optional<std::string> key_path;
};

CLI::App* add_show(CLI::App& config, show_given& given) {
    CLI::App* show = config.add_subcommand("show", "Prints what a configuration file holds");
    show->add_option("--key", given.key_path, "Public key (PEM) to check the signature with");
    show->add_option("FILE", given.path, "File to read")->required();
    return show;
}

}  // namespace

int main(int argc, char** argv) try {
    google::protobuf::SetLogHandler(nullptr);  // we report problems ourselves
    std::ios::sync_with_stdio(false);          // for speed

    CLI::App app("Looks into the files that kivd leaves and makes those that it is given.",
                 "kivtool");
    app.require_subcommand(1);
    report_given reporting;
    build_given building;
    std::vector<std::string> linted;
    show_given showing;
    const CLI::App* report = add_report(app, reporting);
    CLI::App* config = app.add_subcommand("config", "Makes, checks and shows configuration files");
    config->require_subcommand(1);
    const CLI::App* build = add_build(*config, building);
    const CLI::App* lint = add_lint(*config, linted);
    add_show(*config, showing);

    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError& error) {
        return app.exit(error) == 0 ? 0 : wrong_usage;
    }
    if (report->parsed()) return run_report(reporting);
    if (build->parsed()) return run_build(building);
    if (lint->parsed()) return kivd::run_config_lint(linted, std::cout, std::cerr);
    return kivd::run_config_show(showing.path, showing.key_path, std::cout, std::cerr);
} catch (const std::exception& error) {
    std::cerr << "kivtool: " << error.what() << '\n';
    return 1;
}
