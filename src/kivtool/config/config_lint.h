// `kivtool config lint`: finds what the daemon refuses in a configuration, and what it takes in a
// way that its author will not have meant.
#pragma once

#include <ostream>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "kivtool/config/config_source.h"
#include "kivtool/config/lint_findings.h"

namespace kivd {

// Examines a configuration file with these parts. Findings about the whole file call it `path`.
void lint_config(std::string_view bytes, std::span<const part_content> parts,
                 const std::string& path, lint_findings& findings);

// Examines configuration files, and the parts given as PACKAGE:NAME=FILE as one more of them.
// Findings go to `out`, a line each, and what cannot be read to `err`. Returns the exit status: 1
// when something could not be read or an error was found.
[[nodiscard]] int run_config_lint(const std::vector<std::string>& arguments, std::ostream& out,
                                  std::ostream& err);

}  // namespace kivd
