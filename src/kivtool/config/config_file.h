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

// All of these give what is wrong as the end of a sentence, empty when it is done.

// Finds the fields in the bytes of a file; they stay there.
[[nodiscard]] std::string split_config_file(std::string_view bytes, config_file& file);

// Packs and compresses; what is the same gives the same bytes.
[[nodiscard]] std::string compress_package(const kiv::config::ConfigPackage& package,
                                           std::string& compressed_data);

// `notes` gets a sentence for whatever is unusual but taken.
[[nodiscard]] std::string decompress_package(std::string_view compressed_data,
                                             kiv::config::ConfigPackage& package,
                                             std::vector<std::string>& notes);

}  // namespace kivd
