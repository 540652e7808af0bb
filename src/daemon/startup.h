// Starting and stopping the daemon, each step in its order.
#pragma once

namespace kivd {

// Runs the daemon until a stop is requested. Gives the exit status; what makes a start impossible
// is logged and ends the process with status 1.
int run_daemon(int argc, char** argv);

}  // namespace kivd
