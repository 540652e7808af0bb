#include "kivtool/config/config_source.h"

#include <utility>

#include "format/config_file.h"
#include "kivtool/config/config_file.h"
#include "kivtool/config/part_text.h"
#include "toolkit/text_escape.h"
#include "toolkit/whole_file.h"

namespace kivd {

std::optional<part_source> read_part_argument(const std::string& argument) {
    const size_t colon = argument.find(':');
    const size_t equals = argument.find('=', colon == std::string::npos ? 0 : colon);
    if (colon == std::string::npos || equals == std::string::npos) return std::nullopt;
    part_source source = {argument.substr(0, colon), argument.substr(colon + 1, equals - colon - 1),
                          argument.substr(equals + 1)};
    if (source.package.empty() || source.name.empty() || source.path.empty()) return std::nullopt;
    return source;
}

std::string read_part(const part_source& source, part_content& part) {
    part = {source.package, source.name, "", source.path, nullptr};
    std::string content;
    const std::string problem = read_whole_file(source.path, max_config_package_size, content);
    if (!problem.empty()) return printable(source.path) + ": " + problem;
    const auto* type = daemon_part_type(source.package, source.name);
    if (!type) {
        part.payload = std::move(content);
        return "";
    }
    part.places = std::make_unique<google::protobuf::TextFormat::ParseInfoTree>();
    const std::string text_problem = encode_part(*type, content, part.payload, *part.places);
    return text_problem.empty() ? "" : printable(source.path) + ":" + text_problem;
}

std::string pack_parts(std::span<const part_content> parts, kiv::config::ConfigResponse& file) {
    kiv::config::ConfigPackage package;
    for (const part_content& part : parts) {
        kiv::config::ConfigPart& packed = *package.add_parts();
        packed.set_package(part.package);
        packed.set_name(part.name);
        packed.set_payload(part.payload);
    }
    const std::string problem = compress_package(package, *file.mutable_compressed_data());
    config_file ignored;
    return problem.empty() ? split_config_file(file.SerializeAsString(), ignored) : problem;
}

}  // namespace kivd
