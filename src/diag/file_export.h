// Files that privileged clients may walk and fetch, addressed by the number of a file set and of a
// file, both as the texts of a request. There is one set: 750, the diagnostics files.
#pragma once

#include <cstdint>

#include "util/unique_fd.h"

namespace kivd {

// The number of the file behind that one, -1 when there is none. Missing (null) texts have been
// logged and raised.
[[nodiscard]] int32_t next_exported_file(const char* set, const char* number);

// A file to read; not ok when there is none. Missing texts as above.
[[nodiscard]] unique_fd open_exported_file(const char* set, const char* number);

}  // namespace kivd
