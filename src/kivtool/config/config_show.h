// `kivtool config show`: shows what a configuration file holds.
#pragma once

#include <optional>
#include <ostream>
#include <string>

namespace kivd {

// Prints the file's checksum and parts to `out` and its faults to `err`. Given the path of a public
// key, checks the signature as well. Returns the exit status: 0 when all was well.
[[nodiscard]] int run_config_show(const std::string& path,
                                  const std::optional<std::string>& key_path, std::ostream& out,
                                  std::ostream& err);

}  // namespace kivd
