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

// Looks over a configuration file, of which `parts` have been read or made it. `path` is what
// findings about the whole call it.
void lint_config(std::string_view bytes, std::span<const part_content> parts,
                 const std::string& path, lint_findings& findings);

// Looks over configuration files, and over the parts given as PACKAGE:NAME=FILE, which are to
// become one. Findings go to `out`, a line each, and what cannot be read to `err`. Gives the exit
// status: 1 when something could not be read or an error was found.
[[nodiscard]] int run_config_lint(const std::vector<std::string>& arguments, std::ostream& out,
                                  std::ostream& err);

}  // namespace kivd
