// `kivtool report`: shows what report files hold.
#pragma once

#include <optional>
#include <ostream>
#include <string>
#include <vector>

namespace kivd {

enum class report_format { text, json, jsonl, csv, summary };

struct report_options {
    report_format format = report_format::text;
    // The private key that opens sealed reports.
    std::optional<std::string> key_path = std::nullopt;
    // Shows progress on `err`, which is a terminal.
    bool show_progress = false;
};

// Prints each file to `out`, as far as it can be read, and its faults to `err`, one sentence each.
// A directory stands for all its reports in the order of their numbers. Takes bounded memory.
// Returns the exit status: 0 when all was well, 1 otherwise.
[[nodiscard]] int run_report_command(const std::vector<std::string>& paths,
                                     const report_options& options, std::ostream& out,
                                     std::ostream& err);

}  // namespace kivd
