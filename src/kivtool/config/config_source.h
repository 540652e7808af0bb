// What configurations are made of: parts in files of their own, as a command line names them.
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
    std::string path;  // of the payload, or of its text when the part is the daemon's
};

// Reads PACKAGE:NAME=FILE. The package ends at the first colon, the name at the first equals sign
// behind it; none of the three may be empty.
[[nodiscard]] std::optional<part_source> read_part_argument(const std::string& argument);

// A part of a configuration, and where it comes from.
struct part_content {
    std::string package;
    std::string name;
    std::string payload;
    std::string path;  // of the file in which it was found
    // Where its fields are in that file, when that is a text; else null.
    std::unique_ptr<google::protobuf::TextFormat::ParseInfoTree> places;
};

// Reads the part's file, and encodes it when it is the daemon's. What is wrong is thrown as a
// sentence that starts with the path.
[[nodiscard]] part_content read_part(const part_source& source);

// An unsigned configuration file; the same parts give the same bytes. Throws when they are too much
// for one.
[[nodiscard]] kiv::config::ConfigResponse pack_parts(std::span<const part_content> parts);

}  // namespace kivd
