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
    // The private key that signs the configuration.
    std::optional<std::string> key_path = std::nullopt;
    // Builds even what the daemon would refuse.
    bool no_lint = false;
};

// Writes a configuration of these parts, in their order, unless config_lint.h finds an error; its
// findings go to `err`. Returns the exit status. If it is not 0, `err` says why, and what was at
// the output path is still there.
[[nodiscard]] int run_config_build(const std::vector<part_source>& sources,
                                   const config_build_options& options, std::ostream& err);

}  // namespace kivd
