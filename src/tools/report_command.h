// `kivtool report`: shows what report files hold.
#pragma once

#include <optional>
#include <ostream>
#include <string>
#include <vector>

namespace kivd {

enum class report_view { text, json, summary };

struct report_options {
    report_view view = report_view::text;
    // Of the private key that opens sealed reports.
    std::optional<std::string> key_path = std::nullopt;
};

// Prints each file to `out`, as far as it can be read, and what is wrong with it, a sentence each,
// to `err`. Gives the exit status: 0 when all was well, 1 when something was not.
[[nodiscard]] int run_report_command(const std::vector<std::string>& paths,
                                     const report_options& options, std::ostream& out,
                                     std::ostream& err);

}  // namespace kivd
