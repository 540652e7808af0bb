// Files that permitted clients may list and fetch. A set and a file in it are named by numbers, in
// the text form that requests have. There is one set: 750, the diagnostics files.
#pragma once

#include <cstdint>

#include "util/unique_fd.h"

namespace kivd {

// The number of the file that follows that one, -1 when there is none. Missing (null) texts have
// been logged and raised.
[[nodiscard]] int32_t next_exported_file(const char* set, const char* number);

// A file to read; not ok when there is none. Missing texts as above.
[[nodiscard]] unique_fd open_exported_file(const char* set, const char* number);

}  // namespace kivd
