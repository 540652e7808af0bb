// Files that fit in memory, read and written whole. What fails is thrown as one sentence, which
// starts with the path.
#pragma once

#include <cstddef>
#include <cstdio>
#include <optional>
#include <string>
#include <string_view>

namespace kivd {

// What is left of a stream, up to one byte more than `max_size`; nothing, with errno set, when it
// cannot be read.
[[nodiscard]] std::optional<std::string> read_up_to(FILE* file, size_t max_size);

[[nodiscard]] std::string read_whole_file(const std::string& path, size_t max_size);

// Writes a new file and renames it to `path`, so an old one stays when the new one cannot be
// written. Refuses to replace devices and the like.
void replace_file(const std::string& path, std::string_view bytes);

}  // namespace kivd
