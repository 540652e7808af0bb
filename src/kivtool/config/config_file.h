// Configuration files: a compressed package of parts and, before it, a signature over the
// compressed bytes. The form is checked as the daemon checks it.
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
    size_t ignored_size = 0;  // bytes behind them
};

// All of these throw what is wrong, as a sentence about the file or the end of one.

// Finds the fields in the bytes of a file; they stay there.
[[nodiscard]] config_file split_config_file(std::string_view bytes);

// `notes` gets a sentence for whatever is unusual but taken.
[[nodiscard]] kiv::config::ConfigPackage decompress_package(std::string_view compressed_data,
                                                            std::vector<std::string>& notes);

// Packs and compresses; what is the same gives the same bytes.
[[nodiscard]] std::string compress_package(const kiv::config::ConfigPackage& package);

// The bytes of a file.
[[nodiscard]] std::string join_config_file(const kiv::config::ConfigResponse& file);

}  // namespace kivd
