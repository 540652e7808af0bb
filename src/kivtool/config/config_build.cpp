#include "kivtool/config/config_build.h"

#include <exception>
#include <stdexcept>

#include "config.pb.h"
#include "kivtool/config/config_file.h"
#include "kivtool/config/config_lint.h"
#include "kivtool/config/lint_findings.h"
#include "toolkit/keys.h"
#include "toolkit/text_escape.h"
#include "toolkit/whole_file.h"

namespace kivd {
namespace {

void lint(const kiv::config::ConfigResponse& file, const std::vector<part_content>& parts,
          const std::string& path, std::ostream& err) {
    lint_findings findings;
    lint_config(join_config_file(file), parts, path, findings);
    findings.print(err);
    if (!findings.has_errors()) return;
    throw std::runtime_error(
        printable(path) + ": not built because of these errors; --no-lint builds it all the same");
}

}  // namespace

int run_config_build(const std::vector<part_source>& sources, const config_build_options& options,
                     std::ostream& err) try {
    std::vector<part_content> parts;
    parts.reserve(sources.size());
    for (const part_source& source : sources) parts.push_back(read_part(source));
    kiv::config::ConfigResponse file = pack_parts(parts);
    if (!options.no_lint) lint(file, parts, options.output_path, err);
    if (options.key_path) file.set_signature(sign(*options.key_path, file.compressed_data()));
    replace_file(options.output_path, join_config_file(file));
    return 0;
} catch (const std::exception& error) {
    err << "kivtool: " << error.what() << '\n';
    return 1;
}

}  // namespace kivd
