#include "kivtool/config/config_build.h"

#include "config.pb.h"
#include "kivtool/config/config_file.h"
#include "kivtool/config/config_lint.h"
#include "kivtool/config/lint_findings.h"
#include "toolkit/keys.h"
#include "toolkit/text_escape.h"
#include "toolkit/whole_file.h"

namespace kivd {
namespace {

// All of these give what is wrong as a sentence, empty when it is done.

std::string read_parts(const std::vector<part_source>& sources, std::vector<part_content>& parts) {
    std::string problem;
    for (const part_source& source : sources) {
        problem = read_part(source, parts.emplace_back());
        if (!problem.empty()) break;
    }
    return problem;
}

std::string lint(const kiv::config::ConfigResponse& file, const std::vector<part_content>& parts,
                 const std::string& path, std::ostream& err) {
    lint_findings findings;
    lint_config(file.SerializeAsString(), parts, path, findings);
    findings.print(err);
    if (!findings.has_errors()) return "";
    return printable(path) +
           ": not built because of these errors; --no-lint builds it all the same";
}

std::string add_signature(const std::string& key_path, kiv::config::ConfigResponse& file) {
    unique_pkey key;
    std::string problem = read_key(key_path, key_half::private_half, key);
    if (!problem.empty()) return problem;
    problem = sign(*key, file.compressed_data(), *file.mutable_signature());
    return problem.empty() ? "" : printable(key_path) + ": " + problem;
}

std::string build(const std::vector<part_source>& sources, const config_build_options& options,
                  std::ostream& err) {
    std::vector<part_content> parts;
    std::string problem = read_parts(sources, parts);
    if (!problem.empty()) return problem;
    const std::string output = printable(options.output_path) + ": ";
    kiv::config::ConfigResponse file;
    problem = pack_parts(parts, file);
    if (!problem.empty()) return output + problem;
    if (!options.no_lint) problem = lint(file, parts, options.output_path, err);
    if (problem.empty() && options.key_path) problem = add_signature(*options.key_path, file);
    if (!problem.empty()) return problem;

    // Fields are written by their numbers, the signature first.
    const std::string bytes = file.SerializeAsString();
    config_file ignored;
    problem = split_config_file(bytes, ignored);
    if (problem.empty()) problem = replace_file(options.output_path, bytes);
    return problem.empty() ? "" : output + problem;
}

}  // namespace

int run_config_build(const std::vector<part_source>& sources, const config_build_options& options,
                     std::ostream& err) {
    const std::string problem = build(sources, options, err);
    if (problem.empty()) return 0;
    err << "kivtool: " << problem << '\n';
    return 1;
}

}  // namespace kivd
