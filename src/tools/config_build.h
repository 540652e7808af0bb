// `kivtool config build`: makes configuration files.
#pragma once

#include <optional>
#include <ostream>
#include <string>
#include <vector>

namespace kivd {

struct part_source {
    std::string package;
    std::string name;
    std::string path;  // of the payload, or of its text when the part is the daemon's
};

// Reads PACKAGE:NAME=FILE. The package ends at the first colon, the name at the first equals sign
// behind it; none of the three may be empty.
[[nodiscard]] std::optional<part_source> read_part_argument(const std::string& argument);

struct config_build_options {
    std::string output_path;
    // Of the private key that signs the configuration.
    std::optional<std::string> key_path = std::nullopt;
};

// Writes a configuration of these parts, in their order. Gives the exit status; when it is not 0,
// a sentence has gone to `err` and what was at the output path is still there.
[[nodiscard]] int run_config_build(const std::vector<part_source>& sources,
                                   const config_build_options& options, std::ostream& err);

}  // namespace kivd
