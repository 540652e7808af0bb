// Whether the daemon can use a key file.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <optional>
#include <string>

#include "kivctl/process_facts.h"

namespace kivd {

enum class key_verdict : uint8_t {
    unknown,
    usable,
    unusable,      // readable, but no key for that use: whatever needs it is not done at all
    unreadable,    // the daemon may not read it, so its protection is off
    missing,       // also off
    switched_off,  // off by the command line
};

enum class key_use : uint8_t { seal_reports, verify_configurations };

// Looks at the file as the daemon would: by a child with the rights of `user`, in the file system
// that the process `pid` sees. Without a user, and for a user whose rights this process cannot
// have, the answer is what is true for everybody, or unknown. The path is absolute.
[[nodiscard]] key_verdict check_key(const std::string& path, key_use use,
                                    const std::optional<user_ids>& user, std::optional<pid_t> pid);

}  // namespace kivd
