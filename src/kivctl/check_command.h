// `kivctl check`: reports weaknesses that nobody would notice otherwise, one per line.
#pragma once

#include <string>

namespace kivd {

struct check_options {
    std::string base;
    unsigned timeout_ms = 0;
    bool is_json = false;
    std::string key_directory;  // where the keys should be; empty: where the daemon looks
    std::string user;           // who should read them; empty: whoever the daemon runs as
};

// Gives the exit status: 0 when there is nothing, 1 when something was found, 3 when the daemon
// does not answer.
int run_check(const check_options& options);

}  // namespace kivd
