#include "kivtool/config/config_show.h"

#include <exception>
#include <stdexcept>
#include <string_view>
#include <vector>

#include "format/config_file.h"
#include "kivtool/config/config_file.h"
#include "kivtool/config/part_text.h"
#include "toolkit/keys.h"
#include "toolkit/text_escape.h"
#include "toolkit/whole_file.h"

namespace kivd {
namespace {

using problem_list = std::vector<std::string>;

constexpr size_t longest_shown_text = 200;  // bytes

void print_part(const kiv::config::ConfigPart& part, std::ostream& out, problem_list& problems) {
    const std::string id = printable(part.package()) + " " + printable(part.name());
    const std::string& payload = part.payload();
    out << "part: " << id << ", " << payload.size() << " bytes\n";
    if (const auto* type = daemon_part_type(part.package(), part.name())) {
        std::string text;
        const std::string problem = decode_part(*type, payload, text);
        if (!problem.empty()) problems.push_back("the part " + id + " " + problem);
        out << text;
    } else if (!payload.empty() && payload.size() <= longest_shown_text && is_text(payload)) {
        out << "    text: " << printable(payload) << '\n';
    }
}

// Says whether a daemon with this key would accept the configuration.
void print_verdict(const config_file& file, EVP_PKEY& key, std::ostream& out,
                   problem_list& problems) {
    if (!file.signature) {
        out << "signature: none\n";
        problems.emplace_back("is not signed");
        return;
    }
    const bool holds = signature_holds(key, file.compressed_data, *file.signature);
    out << "signature: " << (holds ? "valid" : "NOT valid") << '\n';
    if (!holds) problems.emplace_back("the signature was not made with this key over this package");
}

void print_config(std::string_view bytes, EVP_PKEY* key, std::ostream& out,
                  problem_list& problems) {
    const config_file file = split_config_file(bytes);
    out << "checksum: " << sha1_text(bytes) << '\n';
    out << "signed: " << (file.signature ? "yes, " : "no");
    if (file.signature) out << file.signature->size() << " bytes";
    out << '\n';
    if (key) print_verdict(file, *key, out, problems);

    std::vector<std::string> notes;
    if (file.ignored_size > 0) {
        notes.push_back(std::to_string(file.ignored_size) +
                        " bytes behind the package are ignored");
    }
    const kiv::config::ConfigPackage package = decompress_package(file.compressed_data, notes);
    for (const std::string& note : notes) out << "note: " << note << '\n';
    out << "parts: " << package.parts_size() << '\n';
    for (const auto& part : package.parts()) print_part(part, out, problems);
}

}  // namespace

int run_config_show(const std::string& path, const std::optional<std::string>& key_path,
                    std::ostream& out, std::ostream& err) try {
    unique_pkey key;
    if (key_path) key = read_key(*key_path, key_half::public_half);
    const std::string bytes = read_whole_file(path, max_config_file_size);
    problem_list problems;
    try {
        print_config(bytes, key.get(), out, problems);
    } catch (const std::runtime_error& error) {
        problems.emplace_back(error.what());
    }
    out.flush();  // so that faults come after what could be read
    for (const std::string& text : problems) {
        err << "kivtool: " << printable(path) << ": " << text << '\n';
    }
    if (!out) err << "kivtool: the output could not be written\n";
    return problems.empty() && out ? 0 : 1;
} catch (const std::exception& error) {
    err << "kivtool: " << error.what() << '\n';
    return 1;
}

}  // namespace kivd
