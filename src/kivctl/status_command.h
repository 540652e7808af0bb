// `kivctl status`: the state of the daemon, for people or as JSON.
#pragma once

#include <string>

namespace kivd {

struct status_options {
    std::string base;
    unsigned timeout_ms = 0;
    bool is_json = false;
};

// Gives the exit status: 0 when the daemon answers, 3 otherwise.
int run_status(const status_options& options);

}  // namespace kivd
