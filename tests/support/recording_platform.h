// The platform layer of the tests: it keeps what is logged and answers what the test has set.
#pragma once

#include <map>
#include <string>
#include <vector>

namespace kivd {

using namespace std::string_literals;
using lines = std::vector<std::string>;

// What this process has logged since the last call, as "E kivd-util: text".
lines take_log();

// System properties; all others are absent.
inline std::map<std::string, std::string> properties;

// What the permission service answers.
inline bool permission_answer = false;

}  // namespace kivd
