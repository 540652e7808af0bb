// kivtool: looks into what kivd leaves on disk. Needs no daemon.
#include <google/protobuf/stubs/logging.h>

#include <CLI/CLI.hpp>
#include <exception>
#include <iostream>
#include <string>
#include <vector>

#include "tools/report_command.h"

namespace {
constexpr int wrong_usage = 2;
}

int main(int argc, char** argv) try {
    google::protobuf::SetLogHandler(nullptr);  // problems are told once, by us

    CLI::App app("Looks into the files that kivd leaves.", "kivtool");
    app.require_subcommand(1);

    std::vector<std::string> paths;
    kivd::report_options options;
    bool json = false;
    bool summary = false;
    CLI::App* report = app.add_subcommand(
        "report", "Prints reports, and unfinished ones (private/events), as protobuf text");
    report->add_flag("--json", json, "Print one JSON document for each file");
    report->add_flag("--summary", summary, "Print a summary for people")->excludes("--json");
    report->add_option("--key", options.key_path, "Private key (PEM) that opens sealed reports");
    report->add_option("FILE", paths, "Files to read")->required();

    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError& error) {
        return app.exit(error) == 0 ? 0 : wrong_usage;
    }
    if (json) options.view = kivd::report_view::json;
    if (summary) options.view = kivd::report_view::summary;
    return kivd::run_report_command(paths, options, std::cout, std::cerr);
} catch (const std::exception& error) {
    std::cerr << "kivtool: " << error.what() << '\n';
    return 1;
}
