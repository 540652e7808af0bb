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
    bool json = false;
    bool summary = false;
    CLI::App* report = app.add_subcommand(
        "report", "Prints reports, and unfinished ones (private/events), as protobuf text");
    report->add_flag("--json", json, "Print one JSON document for each file");
    report->add_flag("--summary", summary, "Print a summary for people")->excludes("--json");
    report->add_option("FILE", paths, "Files to read")->required();

    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError& error) {
        return app.exit(error) == 0 ? 0 : wrong_usage;
    }
    const auto other_view = summary ? kivd::report_view::summary : kivd::report_view::text;
    const auto view = json ? kivd::report_view::json : other_view;
    return kivd::run_report_command(paths, view, std::cout, std::cerr);
} catch (const std::exception& error) {
    std::cerr << "kivtool: " << error.what() << '\n';
    return 1;
}
