// What the daemon does with a configuration, found out by its own modules, which take it in an
// empty directory of their own.
#pragma once

#include <span>
#include <string>
#include <string_view>

#include "kivtool/config/config_source.h"
#include "kivtool/config/lint_findings.h"

namespace kivd {

// Has the daemon take the configuration file `bytes`, which holds `parts`, and start again. Finds
// what it complains of, and what it has lost or answers otherwise after the start. No action that
// starts something is run, and no signature checked. `path` is what findings about the whole call
// the configuration. Throws when there is no directory to be had.
void try_config(std::string_view bytes, std::span<const part_content> parts,
                const std::string& path, lint_findings& findings);

}  // namespace kivd
