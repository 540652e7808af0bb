// Finds out what the daemon does with a configuration by letting its own modules take it, in an
// empty directory.
#pragma once

#include <span>
#include <string>
#include <string_view>

#include "kivtool/config/config_source.h"
#include "kivtool/config/lint_findings.h"

namespace kivd {

// Has the daemon take the configuration file `bytes`, which holds `parts`, and start again. Finds
// whatever it complains about, and what it has lost or decides differently after the start. Actions
// that would start a program or the diagnostics are not run, and no signature is checked. Findings
// about the whole file call it `path`. Throws when no directory can be made.
void try_config(std::string_view bytes, std::span<const part_content> parts,
                const std::string& path, lint_findings& findings);

}  // namespace kivd
