// What is wrong with the files of a daemon's directory, which is the current one: a text for each
// fault, with names as they are, or nothing when it cannot be looked at from here.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "kivctl/process_facts.h"
#include "kivctl/questions.h"

namespace kivd {

using fault_list = std::optional<std::vector<std::string>>;

struct left_files {
    fault_list temporary;  // that nobody is about to finish any more
    fault_list unsent;     // reports that could not be made
};
// Asks whether the daemon is alive to wait until it is through with what it writes.
[[nodiscard]] left_files find_left_files(daemon_questions& questions, const process_facts& process);

// List files that the daemon cannot read back whole.
[[nodiscard]] fault_list find_list_faults();

// Filters that accept everything, although the configuration in force brings one.
[[nodiscard]] fault_list find_filter_faults(daemon_questions& questions);

// Sockets that are not there, or not open to every user.
[[nodiscard]] fault_list find_socket_faults();

}  // namespace kivd
