// The configuration file: a protobuf message of an optional signature and the compressed package,
// in this order. Format: docs/configuration.md.
#pragma once

#include <cstdint>
#include <optional>
#include <span>

#include "util/file_io.h"

namespace kivd {

inline constexpr size_t max_config_file_size = 204799;        // bytes
inline constexpr size_t max_config_package_size = 8U << 20U;  // bytes, decompressed

// Writes the two fields to private/new_config.sig and .gz; the former is there only when the file
// has a signature. Bytes behind the second field are ignored. False when the file is not of that
// form; broken lengths and failed writes have been logged and raised.
[[nodiscard]] bool extract_config_fields(std::span<const uint8_t> file);

// The content of private/new_config.gz, decompressed if it is gzip. Nothing when it is spoilt, cut
// short or too large.
[[nodiscard]] std::optional<file_bytes> read_config_package();

}  // namespace kivd
