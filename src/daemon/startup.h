// Starting and stopping the daemon, each step in its order. Everything is found from the working
// directory, the daemon's own sockets included, so its path may be relative or long.
#pragma once

namespace kivd {

// Runs the daemon until a stop is requested. Returns the exit status; what makes a start impossible
// is logged and ends the process with status 1.
int run_daemon(int argc, char** argv);

}  // namespace kivd
