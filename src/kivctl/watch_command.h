// `kivctl watch`: shows the requests that a daemon handles, as its debug interface sends them.
#pragma once

#include <string>

namespace kivd {

struct watch_options {
    std::string host;         // whose debug interface
    std::string package;      // only its requests are shown; empty: all
    bool is_raw = false;      // frames as they came instead of lines
    std::string base;         // directory of the daemon, to ask it whether it still runs
    unsigned timeout_ms = 0;  // for connecting and for that answer
};

// Runs until nobody reads standard output any more, then returns 0; SIGINT and SIGTERM end the
// process with status 0. Any other end is thrown as a failure.
int run_watch(const watch_options& options);

}  // namespace kivd
