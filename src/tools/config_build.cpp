#include "tools/config_build.h"

#include <set>
#include <utility>

#include "config.pb.h"
#include "tools/config_file.h"
#include "tools/keys.h"
#include "tools/part_text.h"
#include "tools/text_escape.h"
#include "tools/whole_file.h"

namespace kivd {
namespace {

// The daemon keeps package and name, with some numbers, in a record of at most 1024 bytes.
constexpr size_t max_id_size = 1000;

// All of these give what is wrong as a sentence, empty when it is done.

std::string id_of(const part_source& source) {
    return printable(source.package) + ":" + printable(source.name);
}

std::string check_ids(const std::vector<part_source>& sources) {
    std::set<std::pair<std::string, std::string>> seen;
    for (const part_source& source : sources) {
        if (source.package == "kivd" && source.name == "_last_id") {
            return id_of(source) + ": is the daemon's own, no part can have that name";
        }
        if (source.package.size() + source.name.size() > max_id_size) {
            return id_of(source) + ": package and name have at most " +
                   std::to_string(max_id_size) + " bytes together";
        }
        if (!seen.emplace(source.package, source.name).second) {
            return id_of(source) + ": is given twice";
        }
    }
    return "";
}

std::string add_part(const part_source& source, kiv::config::ConfigPackage& package) {
    kiv::config::ConfigPart& part = *package.add_parts();
    part.set_package(source.package);
    part.set_name(source.name);
    std::string content;
    const std::string problem = read_whole_file(source.path, max_package_size, content);
    if (!problem.empty()) return printable(source.path) + ": " + problem;
    const auto* type = daemon_part_type(source.package, source.name);
    if (!type) {
        part.set_payload(std::move(content));
        return "";
    }
    const std::string text_problem = encode_part(*type, content, *part.mutable_payload());
    return text_problem.empty() ? "" : printable(source.path) + ":" + text_problem;
}

std::string add_signature(const std::string& key_path, kiv::config::ConfigResponse& file) {
    unique_pkey key;
    std::string problem = read_key(key_path, key_half::private_half, key);
    if (!problem.empty()) return problem;
    problem = sign(*key, file.compressed_data(), *file.mutable_signature());
    return problem.empty() ? "" : printable(key_path) + ": " + problem;
}

std::string build(const std::vector<part_source>& sources, const config_build_options& options) {
    std::string problem = check_ids(sources);
    kiv::config::ConfigPackage package;
    for (const part_source& source : sources) {
        if (problem.empty()) problem = add_part(source, package);
    }
    if (!problem.empty()) return problem;

    const std::string output = printable(options.output_path) + ": ";
    kiv::config::ConfigResponse file;
    problem = compress_package(package, *file.mutable_compressed_data());
    if (!problem.empty()) return output + problem;
    if (options.key_path) problem = add_signature(*options.key_path, file);
    if (!problem.empty()) return problem;

    // Fields are written by their numbers, the signature first.
    const std::string bytes = file.SerializeAsString();
    config_file ignored;
    problem = split_config_file(bytes, ignored);
    if (problem.empty()) problem = replace_file(options.output_path, bytes);
    return problem.empty() ? "" : output + problem;
}

}  // namespace

std::optional<part_source> read_part_argument(const std::string& argument) {
    const size_t colon = argument.find(':');
    const size_t equals = argument.find('=', colon == std::string::npos ? 0 : colon);
    if (colon == std::string::npos || equals == std::string::npos) return std::nullopt;
    part_source source = {argument.substr(0, colon), argument.substr(colon + 1, equals - colon - 1),
                          argument.substr(equals + 1)};
    if (source.package.empty() || source.name.empty() || source.path.empty()) return std::nullopt;
    return source;
}

int run_config_build(const std::vector<part_source>& sources, const config_build_options& options,
                     std::ostream& err) {
    const std::string problem = build(sources, options);
    if (problem.empty()) return 0;
    err << "kivtool: " << problem << '\n';
    return 1;
}

}  // namespace kivd
