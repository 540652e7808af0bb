// `kivctl check`: says what is weak without anybody noticing, a line for each finding.
#pragma once

#include <string>

namespace kivd {

struct check_options {
    std::string base;
    unsigned timeout_ms = 0;
    bool is_json = false;
    std::string key_directory;  // where the keys ought to be; empty: where the daemon looks
    std::string user;           // who ought to read them; empty: who the daemon runs as
};

// Gives the exit status: 0 when there is nothing, 1 when something was found, 3 when the daemon
// does not answer.
int run_check(const check_options& options);

}  // namespace kivd
