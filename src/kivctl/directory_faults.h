// Faults in the files of a daemon's directory, which is the current one: a text for each, names not
// escaped; nothing when it cannot be examined from here.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "kivctl/process_facts.h"
#include "kivctl/questions.h"

namespace kivd {

using fault_list = std::optional<std::vector<std::string>>;

struct left_files {
    fault_list temporary;  // abandoned by whoever wrote them
    fault_list unsent;     // reports that could not be made
};
// Asks the daemon whether it is alive, so that it has finished what it was writing.
[[nodiscard]] left_files find_left_files(daemon_questions& questions, const process_facts& process);

// List files that the daemon cannot read back completely.
[[nodiscard]] fault_list find_list_faults();

// Filters that accept everything although the configuration in force has one.
[[nodiscard]] fault_list find_filter_faults(daemon_questions& questions);

// Sockets that are missing, or not open to every user.
[[nodiscard]] fault_list find_socket_faults();

}  // namespace kivd
