// The command line.
#pragma once

namespace kivd {

struct options {
    const char* base_directory;  // as given
    bool detach;
    bool debug_interface;
};

// Passes what the command line says to the modules concerned and returns the rest. Ends the process
// when help is asked for, a certificate path does not exist, or a file is to be verified or sealed
// (errors then go to the daemon of the base directory, if one runs). Unknown options are reported
// on standard error and ignored.
[[nodiscard]] options parse_options(int argc, char** argv);

}  // namespace kivd
