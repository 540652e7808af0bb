// What every user of the machine may do with a file.
#pragma once

#include <sys/types.h>

#include <string>

namespace kivd {

// Whether every user can open the file for what one of the bits of `mode` (S_IROTH, S_IWOTH) says,
// and search each directory on the way. False when that cannot be found out.
[[nodiscard]] bool is_open_to_all(const std::string& path, mode_t mode);

}  // namespace kivd
