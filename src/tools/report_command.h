// `kivtool report`: shows what report files hold.
#pragma once

#include <ostream>
#include <string>
#include <vector>

namespace kivd {

enum class report_view { text, json, summary };

// Prints each file to `out`, as far as it can be read, and what is wrong with it, a sentence each,
// to `err`. Gives the exit status: 0 when all was well, 1 when something was not.
[[nodiscard]] int run_report_command(const std::vector<std::string>& paths, report_view view,
                                     std::ostream& out, std::ostream& err);

}  // namespace kivd
