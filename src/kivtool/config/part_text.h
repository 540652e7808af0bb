// The parts of a configuration that the daemon reads itself, as protobuf text.
#pragma once

#include <google/protobuf/message.h>
#include <google/protobuf/text_format.h>

#include <span>
#include <string>
#include <string_view>

namespace kivd {

inline constexpr std::string_view daemon_package = "kivd";

struct daemon_part {
    std::string_view name;
    const google::protobuf::Message& (*type)();
};
[[nodiscard]] std::span<const daemon_part> daemon_parts();

// An empty message of the type that the part holds; null when the part is for others.
[[nodiscard]] const google::protobuf::Message* daemon_part_type(std::string_view package,
                                                                std::string_view name);

// Encodes `text`; `places` gets where its fields are. Gives what is wrong as "LINE:COLUMN: reason",
// both counted from 1, empty when `payload` has been made.
[[nodiscard]] std::string encode_part(const google::protobuf::Message& type,
                                      const std::string& text, std::string& payload,
                                      google::protobuf::TextFormat::ParseInfoTree& places);

// The other way; every line of `text` is indented. Gives what is wrong as the end of a sentence
// about the part, empty when all is well; `text` then holds what could be read.
[[nodiscard]] std::string decode_part(const google::protobuf::Message& type,
                                      const std::string& payload, std::string& text);

}  // namespace kivd
