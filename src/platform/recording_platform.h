// A platform layer in the place of the real one, for programs that only try the daemon's modules:
// it keeps what is logged, and answers what it has been told to.
#pragma once

#include <map>
#include <string>
#include <vector>

namespace kivd {

using lines = std::vector<std::string>;

// What this process has logged since the last call, as "E kivd-util: text"; W is a warning, I an
// information.
lines take_log();

// System properties; all others are absent.
inline std::map<std::string, std::string> properties;

}  // namespace kivd
