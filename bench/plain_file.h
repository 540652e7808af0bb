// Files written and read in the plainest way.
#pragma once

#include <string>
#include <string_view>

namespace kivd::bench {

// Replaces the content of the file at `path`.
void write_file(const std::string& path, std::string_view bytes);
[[nodiscard]] std::string read_file(const std::string& path);

}  // namespace kivd::bench
