#include "kivtool/config/config_source.h"

#include <stdexcept>
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

part_content read_part(const part_source& source) {
    part_content part = {source.package, source.name, "", source.path, nullptr};
    std::string content = read_whole_file(source.path, max_config_package_size);
    const auto* type = daemon_part_type(source.package, source.name);
    if (!type) {
        part.payload = std::move(content);
        return part;
    }
    part.places = std::make_unique<google::protobuf::TextFormat::ParseInfoTree>();
    const std::string fault = encode_part(*type, content, part.payload, *part.places);
    if (!fault.empty()) throw std::runtime_error(printable(source.path) + ":" + fault);
    return part;
}

kiv::config::ConfigResponse pack_parts(std::span<const part_content> parts) {
    kiv::config::ConfigPackage package;
    for (const part_content& part : parts) {
        kiv::config::ConfigPart& packed = *package.add_parts();
        packed.set_package(part.package);
        packed.set_name(part.name);
        packed.set_payload(part.payload);
    }
    kiv::config::ConfigResponse file;
    file.set_compressed_data(compress_package(package));
    return file;
}

}  // namespace kivd
