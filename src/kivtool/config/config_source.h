// The parts that a configuration is made of, each in a file named on the command line.
#pragma once

#include <google/protobuf/text_format.h>

#include <memory>
#include <optional>
#include <span>
#include <string>

#include "config.pb.h"

namespace kivd {

struct part_source {
    std::string package;
    std::string name;
    std::string path;  // of the payload; of its text if the part is one of the daemon's own
};

// Parses PACKAGE:NAME=FILE. The package ends at the first colon, the name at the first equals sign
// after it; none of the three may be empty.
[[nodiscard]] std::optional<part_source> read_part_argument(const std::string& argument);

// A part of a configuration, and where it comes from.
struct part_content {
    std::string package;
    std::string name;
    std::string payload;
    std::string path;  // of the file it comes from
    // Where its fields are in that file; null unless it is a text.
    std::unique_ptr<google::protobuf::TextFormat::ParseInfoTree> places;
};

// Reads the part's file, and encodes it if it is one of the daemon's own. Throws a sentence that
// starts with the path.
[[nodiscard]] part_content read_part(const part_source& source);

// An unsigned configuration file; the same parts always give the same bytes. Throws when they are
// too large.
[[nodiscard]] kiv::config::ConfigResponse pack_parts(std::span<const part_content> parts);

}  // namespace kivd
