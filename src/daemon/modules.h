// The daemon's modules, but for the sockets: started together and released together.
#pragma once

namespace kivd {

// Starts them on the files of the current directory, in which private/ and output/ are: what is
// remembered is loaded, mended where a crash has spoilt it, and in force. The options have to be
// read first. True when there was a filter for events.
bool start_modules();

// Waits for the children that make files and puts all that the process keeps back to what it was
// when it began, so that the modules can be started anew. Nothing is saved. What stays is the
// process's own: where it logs to, its lock, its limit of descriptors.
void release_modules();

}  // namespace kivd
