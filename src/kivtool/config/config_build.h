// `kivtool config build`: makes configuration files.
#pragma once

#include <optional>
#include <ostream>
#include <string>
#include <vector>

#include "kivtool/config/config_source.h"

namespace kivd {

struct config_build_options {
    std::string output_path;
    // Of the private key that signs the configuration.
    std::optional<std::string> key_path = std::nullopt;
    // Builds what the daemon would refuse, too.
    bool no_lint = false;
};

// Writes a configuration of these parts, in their order, unless config_lint.h finds an error; what
// it finds goes to `err`. Gives the exit status; when it is not 0, a sentence has gone to `err` and
// what was at the output path is still there.
[[nodiscard]] int run_config_build(const std::vector<part_source>& sources,
                                   const config_build_options& options, std::ostream& err);

}  // namespace kivd
