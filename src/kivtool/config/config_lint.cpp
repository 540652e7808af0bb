#include "kivtool/config/config_lint.h"

#include <algorithm>
#include <numeric>
#include <set>
#include <stdexcept>
#include <string_view>
#include <utility>

#include "config.pb.h"
#include "format/config_file.h"
#include "format/list_record.h"
#include "kivtool/config/config_file.h"
#include "kivtool/config/config_trial.h"
#include "kivtool/config/filter_lint.h"
#include "kivtool/config/part_text.h"
#include "toolkit/text_escape.h"
#include "toolkit/whole_file.h"

namespace kivd {
namespace {

// What a record of the daemon's list of parts holds beside package and name, in bytes: an id of up
// to 10 digits, whether the part is in use, NULs and a line feed.
constexpr size_t max_record_overhead = 17;

constexpr char refuses[] = "; the daemon refuses the configuration";

constexpr size_t near = 2;           // letters by which similar names may differ
constexpr size_t longest_near = 64;  // letters of a name that is compared

lint_place place_of(const part_content& part) { return {part.path, 0, id_of(part)}; }

// How many letters have to be changed, added or removed to get from one to the other, ignoring
// case.
size_t distance(std::string_view a, std::string_view b) {
    std::vector<size_t> row(b.size() + 1);
    std::iota(row.begin(), row.end(), size_t{0});
    for (size_t i = 0; i < a.size(); ++i) {
        size_t diagonal = std::exchange(row[0], i + 1);
        for (size_t k = 0; k < b.size(); ++k) {
            const bool same = (a[i] | 0x20) == (b[k] | 0x20);
            const size_t changed = diagonal + (same ? 0 : 1);
            diagonal = row[k + 1];
            row[k + 1] = std::min({changed, row[k] + 1, row[k + 1] + 1});
        }
    }
    return row.back();
}

void lint_own_part(const part_content& part, lint_findings& findings) {
    if (part.package != daemon_package) return;
    if (const auto* type = daemon_part_type(part.package, part.name)) {
        std::string text;
        const std::string problem = decode_part(*type, part.payload, text);
        if (problem.empty()) return;
        return findings.error(place_of(part), problem + "; the daemon goes on without it");
    }
    for (const daemon_part& own : daemon_parts()) {
        if (part.name.size() > longest_near || distance(part.name, own.name) > near) continue;
        return findings.error(place_of(part), "the daemon does not know it, is " +
                                                  std::string(own.name) +
                                                  " meant? It only keeps it for programs");
    }
    findings.warning(place_of(part),
                     "the daemon does not know it; at most it keeps it for programs");
}

void lint_id(const part_content& part, lint_findings& findings) {
    constexpr char nobody[] = "no program can ask the daemon for it";
    lint_text(place_of(part), "package", part.package, nobody, findings);
    lint_text(place_of(part), "name", part.name, nobody, findings);
    const size_t size = part.package.size() + part.name.size() + max_record_overhead;
    if (size <= list_record_size_max) return;
    findings.warning(place_of(part), "package and name make a record of up to " +
                                         std::to_string(size) + " bytes; the daemon reads " +
                                         std::to_string(list_record_size_max) +
                                         " at most and may refuse the configuration");
}

// Finds what the daemon accepts without complaint, but the author can hardly have meant.
void lint_parts(std::span<const part_content> parts, lint_findings& findings) {
    std::set<std::pair<std::string_view, std::string_view>> seen;
    for (const part_content& part : parts) {
        lint_id(part, findings);
        lint_own_part(part, findings);
        // The daemon reads them up to a NUL.
        if (!seen.emplace(part.package.c_str(), part.name.c_str()).second) {
            findings.error(place_of(part), "is given twice; the daemon takes the last one");
        }
        if (part.package != daemon_package || part.name != "FilterConfig") continue;
        for (const written_filter& filter : filters_of(part)) lint_filter(filter, findings);
    }
}

// The parts of a configuration file; a fault of the file itself becomes an error.
std::vector<part_content> read_config_file(const std::string& path, std::string_view bytes,
                                           lint_findings& findings) {
    const lint_place place = {path, 0, ""};
    std::vector<part_content> parts;
    std::vector<std::string> notes;
    try {
        const config_file file = split_config_file(bytes);
        if (file.ignored_size > 0) {
            notes.push_back(std::to_string(file.ignored_size) +
                            " bytes behind the package; the daemon ignores them");
        }
        kiv::config::ConfigPackage package = decompress_package(file.compressed_data, notes);
        for (auto& part : *package.mutable_parts()) {
            parts.push_back({std::move(*part.mutable_package()), std::move(*part.mutable_name()),
                             std::move(*part.mutable_payload()), path, nullptr});
        }
    } catch (const std::runtime_error& error) {
        findings.error(place, std::string(error.what()) + refuses);
    }
    for (const std::string& note : notes) findings.warning(place, note);
    return parts;
}

void lint_file(const std::string& path, lint_findings& findings) {
    const std::string bytes = read_whole_file(path, max_config_file_size);
    lint_findings about_file;
    const auto parts = read_config_file(path, bytes, about_file);
    if (!about_file.has_errors()) lint_config(bytes, parts, path, about_file);
    findings.append(std::move(about_file));
}

// Examines parts as one configuration.
void lint_given(std::span<const part_content> parts, lint_findings& findings) {
    constexpr char path[] = "configuration";
    std::string bytes;
    try {
        bytes = join_config_file(pack_parts(parts));
    } catch (const std::runtime_error& error) {
        return findings.error({path, 0, ""}, std::string(error.what()) + refuses);
    }
    lint_config(bytes, parts, path, findings);
}

}  // namespace

void lint_config(std::string_view bytes, std::span<const part_content> parts,
                 const std::string& path, lint_findings& findings) {
    lint_parts(parts, findings);
    try_config(bytes, parts, path, findings);
}

int run_config_lint(const std::vector<std::string>& arguments, std::ostream& out,
                    std::ostream& err) {
    lint_findings findings;
    std::vector<part_content> given;
    bool all_given = true;
    std::vector<std::string> problems;
    for (const std::string& argument : arguments) {
        const auto source = read_part_argument(argument);
        try {
            if (source) {
                given.push_back(read_part(*source));
            } else {
                lint_file(argument, findings);
            }
        } catch (const std::exception& error) {
            problems.emplace_back(error.what());
            all_given = all_given && !source;
        }
    }
    if (!given.empty() && all_given) lint_given(given, findings);
    findings.print(out);
    out.flush();
    for (const std::string& problem : problems) err << "kivtool: " << problem << '\n';
    if (!out) err << "kivtool: the output could not be written\n";
    return problems.empty() && !findings.has_errors() && out ? 0 : 1;
}

}  // namespace kivd
