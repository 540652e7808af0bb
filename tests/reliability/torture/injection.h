// Faults in single system calls, by strace.
#pragma once

#include <map>
#include <set>
#include <string>
#include <vector>

#include "support/daemon_process.h"

namespace kivd {

struct traced_call {
    std::string process;
    bool by_child;     // the compactor or the compressor
    std::string name;  // as strace calls it
    std::string path;  // as the daemon calls it; empty where it doesn't matter
    bool reads;
    int number;                         // of those of its process with that name and path
    std::map<std::string, int> before;  // what of each name its process had made on `paths`
};

// A life's calls on files, and what else may fail.
struct recording {
    std::vector<traced_call> calls;
    std::set<std::string> paths[2];  // what is changed by the daemon, and by its children alone
};

// What happens to a call: "signal=SIGKILL" (ahead of it), "error=EIO", "retval=0".
struct fault {
    const char* what;
    bool lasting;  // to this one, and all later ones that change files
};

inline constexpr char strace_path[] = "/usr/bin/strace";

// Both go in front of the daemon's command. What was recorded is read when it has ended.
std::vector<std::string> record_arguments();
std::vector<std::string> inject_arguments(const recording& all, const traced_call& hit,
                                          const fault& injected);
recording read_recording();
bool was_injected();
void end_injection(const daemon_process& daemon);

}  // namespace kivd
