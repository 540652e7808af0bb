// Taking a configuration file apart and unpacking it. Layout and limits: format/config_file.h.
#pragma once

#include <cstdint>
#include <optional>
#include <span>

#include "util/file_io.h"

namespace kivd {

// Writes the two fields to private/new_config.sig and .gz; the former is there only when the file
// has a signature. Bytes behind the second field are ignored. False when the file is not of that
// form; broken lengths and failed writes have been logged and raised.
[[nodiscard]] bool extract_config_fields(std::span<const uint8_t> file);

// The content of private/new_config.gz, decompressed if it is gzip. Nothing when it is spoilt, cut
// short or too large.
[[nodiscard]] std::optional<file_bytes> read_config_package();

}  // namespace kivd
