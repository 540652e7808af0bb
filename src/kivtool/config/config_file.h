// Reading and writing configuration files: a compressed package of parts and, before it, a
// signature over the compressed bytes. Format: format/config_file.h.
#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "config.pb.h"

namespace kivd {

struct config_file {
    std::optional<std::string_view> signature;
    std::string_view compressed_data;
    size_t ignored_size = 0;  // bytes after the package
};

// All of these throw a std::runtime_error that says what is wrong, as a sentence or the end of one
// about the file.

// The fields are views of `bytes`.
[[nodiscard]] config_file split_config_file(std::string_view bytes);

// `notes` gets a sentence for whatever is unusual but accepted.
[[nodiscard]] kiv::config::ConfigPackage decompress_package(std::string_view compressed_data,
                                                            std::vector<std::string>& notes);

// The same package always gives the same bytes.
[[nodiscard]] std::string compress_package(const kiv::config::ConfigPackage& package);

// The bytes of the file, which must not be too many.
[[nodiscard]] std::string join_config_file(const kiv::config::ConfigResponse& file);

}  // namespace kivd
