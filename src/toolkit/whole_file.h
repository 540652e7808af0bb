// Files that fit in memory, read and written whole. What fails is thrown as one sentence, which
// starts with the path.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace kivd {

[[nodiscard]] std::string read_whole_file(const std::string& path, size_t max_size);

// Puts a new file in the place of the one at `path`, if there is one: by a rename, so that what
// was there stays when the new one cannot be written. Refuses devices and the like.
void replace_file(const std::string& path, std::string_view bytes);

}  // namespace kivd
