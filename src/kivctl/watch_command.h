// `kivctl watch`: shows the requests that a daemon handles, as its debug interface gives them.
#pragma once

#include <string>

namespace kivd {

struct watch_options {
    std::string host;         // whose debug interface
    std::string package;      // show its requests only; empty: all
    bool is_raw = false;      // frames as they came instead of lines
    std::string base;         // directory of the daemon, to ask it whether it still runs
    unsigned timeout_ms = 0;  // for connecting and for that answer
};

// Runs until nobody reads standard output any more, and gives 0 then; SIGINT and SIGTERM end the
// process with status 0. Everything else that ends it is thrown as a failure.
int run_watch(const watch_options& options);

}  // namespace kivd
