// The parts of a configuration that are for the daemon itself, as protobuf text.
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

// An empty message of the part's type; null when the part is not for the daemon.
[[nodiscard]] const google::protobuf::Message* daemon_part_type(std::string_view package,
                                                                std::string_view name);

// Encodes `text`; `places` tells where its fields are. Returns its first fault as
// "LINE:COLUMN: reason", both counted from 1; empty when it has none.
[[nodiscard]] std::string encode_part(const google::protobuf::Message& type,
                                      const std::string& text, std::string& payload,
                                      google::protobuf::TextFormat::ParseInfoTree& places);

// Decodes `payload` to indented lines, as far as possible. Returns what is wrong as the end of a
// sentence about the part; empty when nothing is.
[[nodiscard]] std::string decode_part(const google::protobuf::Message& type,
                                      const std::string& payload, std::string& text);

}  // namespace kivd
