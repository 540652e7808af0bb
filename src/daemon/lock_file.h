// The lock that keeps a second daemon out of the working directory.
#pragma once

namespace kivd {

// Takes the lock and writes the process id into its file. It is held, through the open descriptor,
// until the process and its children have ended. A failure is logged and ends the process with exit
// status 1, a lock that another one holds too.
void take_lock();

}  // namespace kivd
