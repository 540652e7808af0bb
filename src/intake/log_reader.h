// The log reader: a separate program that the daemon starts as a child. The daemon knows no more of
// it than whether it runs. It outlives the daemon.
#pragma once

namespace kivd {

// Failures have been logged and raised.
void start_log_reader();

// Stops the one that start_log_reader started, if it still runs, and waits until it has ended or
// the daemon is to stop.
void stop_log_reader();

// Lets go of it without stopping it.
void log_reader_release();

}  // namespace kivd
