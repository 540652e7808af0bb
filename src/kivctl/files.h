// `kivctl files`: the daemon's diagnostics files. Both return the exit status, or the error of
// libkiv; other failures are thrown.
#pragma once

#include <cstdint>
#include <string>

#include "kiv.h"

namespace kivd {

// Prints a line for each file: its number and its size. All answers together have to come within
// that time.
int list_files(kiv_handle* daemon, unsigned timeout_ms);

// Writes the file with that number to `path`, or to standard output when that is empty.
int get_file(kiv_handle* daemon, int32_t number, const std::string& path);

}  // namespace kivd
