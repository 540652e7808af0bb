// `kivctl files`: the daemon's diagnostics files. Both give the exit status, or what libkiv gave
// when it failed; all else that fails is thrown.
#pragma once

#include <cstdint>
#include <string>

#include "kiv.h"

namespace kivd {

// Prints a line for each file: its number and its size. The answers have to come within that time,
// all of them together.
int list_files(kiv_handle* daemon, unsigned timeout_ms);

// Writes the file with that number to `path`, or to standard output when that is empty.
int get_file(kiv_handle* daemon, int32_t number, const std::string& path);

}  // namespace kivd
