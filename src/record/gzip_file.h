// Compressing one whole file.
#pragma once

#include <cstdint>

namespace kivd {

enum class gzip_level : uint8_t {
    stored,  // gzip framing around uncompressed data
    best,
};

// Copies the file `source` into the gzip file `destination`, by writes of its own rather than
// zlib's, so that a full device shows. False when not all of it has been written: a failure to open
// either has been logged and raised, and a part of the destination may remain.
[[nodiscard]] bool gzip_file(const char* source, const char* destination, gzip_level level);

}  // namespace kivd
