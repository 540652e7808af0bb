#include "kivtool/config/config_lint.h"

#include <algorithm>
#include <array>
#include <cstdint>
#include <cstring>
#include <iterator>
#include <numeric>
#include <optional>
#include <set>
#include <string_view>
#include <utility>

#include "config.pb.h"
#include "config/limits.h"
#include "kivtool/config/config_file.h"
#include "kivtool/config/filter_lint.h"
#include "kivtool/config/part_text.h"
#include "settings.pb.h"
#include "toolkit/text_escape.h"
#include "toolkit/whole_file.h"

namespace kivd {
namespace {

constexpr std::string_view own_package = "kivd";
constexpr char reserved_name[] = "_last_id";
constexpr const char* own_names[] = {"FilterConfig", "Settings", "RunActions", "RunActionsOnce"};

// Around package and name in a record of the daemon's list of parts: NULs, a line feed, whether it
// is in use, and an id of 1 to 10 digits.
constexpr size_t record_overhead = 7;
constexpr size_t longest_id = 10;

constexpr size_t near = 2;           // letters in which two names differ
constexpr size_t longest_near = 64;  // letters of a name that may be near another

bool is_own(const part_content& part, const char* name) {
    return part.package == own_package && part.name == name;
}

lint_place place_of(const part_content& part) { return {part.path, 0, id_of(part)}; }

// How many letters to change, add or take away to make one of the other; capitals are no others.
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

void lint_own_name(const part_content& part, lint_findings& findings) {
    if (part.package != own_package) return;
    if (part.name == reserved_name) {
        findings.error(place_of(part), "is the daemon's own name; the daemon skips the part");
        return;
    }
    if (daemon_part_type(part.package, part.name)) return;
    if (part.name.size() <= longest_near) {
        for (const char* name : own_names) {
            if (distance(part.name, name) > near) continue;
            findings.error(place_of(part), std::string("the daemon does not know it, is ") + name +
                                               " meant? It only keeps it for programs");
            return;
        }
    }
    findings.warning(place_of(part), "the daemon does not know it and only keeps it for programs");
}

void lint_id(const part_content& part, lint_findings& findings) {
    for (const auto& [what, text] :
         {std::pair("package", &part.package), std::pair("name", &part.name)}) {
        if (strlen(text->c_str()) < text->size()) {
            findings.error(
                place_of(part),
                std::string("its ") + what + " holds a NUL; the daemon reads it up to there only");
        } else if (text->empty()) {
            findings.error(place_of(part), std::string("its ") + what +
                                               " is empty; no program can ask the daemon for it");
        } else if (text->find(' ') != std::string::npos) {
            findings.warning(place_of(part), std::string("its ") + what +
                                                 " holds a blank; no program can ask the daemon "
                                                 "for it");
        }
    }
    const size_t size = part.package.size() + part.name.size() + record_overhead;
    const std::string lost = " bytes; the daemon reads " + std::to_string(max_list_record) +
                             " at most and forgets this part and others at its next start";
    if (size + 1 > max_list_record) {
        findings.error(place_of(part),
                       "package and name make a record of " + std::to_string(size + 1) + lost);
    } else if (size + longest_id > max_list_record) {
        findings.warning(place_of(part), "package and name make a record of up to " +
                                             std::to_string(size + longest_id) + lost);
    }
}

// Decodes a part; nothing when there is none, or it cannot be decoded, which is told.
template <class message>
std::optional<message> decode(const part_content* part, const char* effect,
                              lint_findings& findings) {
    if (!part) return std::nullopt;
    message decoded;
    if (decoded.ParseFromString(part->payload)) return decoded;
    findings.error(place_of(*part), std::string("cannot be decoded; ") + effect);
    return std::nullopt;
}

void lint_limits(const part_content& part, const Settings& settings, lint_findings& findings) {
    const uint32_t report = settings.has_max_report_size() ? settings.max_report_size()
                                                           : default_limits.max_report_size;
    const uint32_t output = settings.has_max_output_dir_size() ? settings.max_output_dir_size()
                                                               : default_limits.max_output_dir_size;
    if (report <= output) return;
    const int field = settings.has_max_report_size() ? Settings::kMaxReportSizeFieldNumber
                                                     : Settings::kMaxOutputDirSizeFieldNumber;
    lint_place place = place_of(part);
    place.line = line_of(part.places.get(), *Settings::descriptor()->FindFieldByNumber(field));
    findings.error(place, "max_report_size, " + std::to_string(report) +
                              (settings.has_max_report_size() ? "" : " unless given") +
                              ", is above max_output_dir_size, " + std::to_string(output) +
                              (settings.has_max_output_dir_size() ? "" : " unless given") +
                              "; the daemon returns both to " +
                              std::to_string(default_limits.max_report_size) + " and " +
                              std::to_string(default_limits.max_output_dir_size));
}

void lint_actions(std::span<const part_content> parts, lint_findings& findings) {
    // Of parts with the same name, the daemon takes the last.
    const auto find = [parts](const char* name) -> const part_content* {
        const auto found = std::find_if(parts.rbegin(), parts.rend(),
                                        [name](const auto& part) { return is_own(part, name); });
        return found == parts.rend() ? nullptr : &*found;
    };
    const part_content* const settings_part = find("Settings");
    const auto settings = decode<Settings>(
        settings_part, "the daemon returns all limits to their defaults", findings);
    (void)decode<RunActions>(find("RunActions"), "the daemon leaves what runs as it is", findings);
    const auto once =
        decode<RunActionsOnce>(find("RunActionsOnce"), "the daemon does nothing of it", findings);
    if (settings) lint_limits(*settings_part, *settings, findings);
    if (!settings || !settings->permanently_disable() || !once || !once->remove_reports()) return;
    lint_place place = place_of(*settings_part);
    place.line = line_of(
        settings_part->places.get(),
        *Settings::descriptor()->FindFieldByNumber(Settings::kPermanentlyDisableFieldNumber));
    findings.error(place,
                   "permanently_disable together with remove_reports of kivd:RunActionsOnce, which "
                   "also removes the mark of a disabled daemon; the daemon stops until its next "
                   "start only");
}

// The parts of a configuration file. What is wrong with the file itself is an error, too.
void read_config_file(const std::string& path, std::string_view bytes,
                      std::vector<part_content>& parts, lint_findings& findings) {
    const lint_place place = {path, 0, ""};
    const auto refuse = [&](const std::string& problem) {
        findings.error(place, problem + "; the daemon refuses the configuration");
    };
    config_file file;
    std::string problem = split_config_file(bytes, file);
    if (!problem.empty()) return refuse(problem);
    if (file.ignored_size > 0) {
        findings.warning(place, std::to_string(file.ignored_size) +
                                    " bytes behind the package; the daemon ignores them");
    }
    std::vector<std::string> notes;
    kiv::config::ConfigPackage package;
    problem = decompress_package(file.compressed_data, package, notes);
    for (const std::string& note : notes) findings.warning(place, note);
    if (!problem.empty()) return refuse(problem);
    for (auto& part : *package.mutable_parts()) {
        parts.push_back({std::move(*part.mutable_package()), std::move(*part.mutable_name()),
                         std::move(*part.mutable_payload()), path, nullptr});
    }
}

// Whether the parts together are too large.
void lint_size(std::span<const part_content> parts, const std::string& path,
               lint_findings& findings) {
    kiv::config::ConfigPackage package;
    for (const part_content& part : parts) {
        auto& packed = *package.add_parts();
        packed.set_package(part.package);
        packed.set_name(part.name);
        packed.set_payload(part.payload);
    }
    kiv::config::ConfigResponse file;
    std::string problem = compress_package(package, *file.mutable_compressed_data());
    config_file ignored;
    if (problem.empty()) problem = split_config_file(file.SerializeAsString(), ignored);
    if (problem.empty()) return;
    findings.error({path, 0, ""}, problem + "; the daemon refuses the configuration");
}

}  // namespace

void lint_config(std::span<const part_content> parts, const std::string& path,
                 lint_findings& findings) {
    std::set<std::pair<std::string_view, std::string_view>> seen;
    bool has_filters = false;
    for (const part_content& part : parts) {
        lint_id(part, findings);
        lint_own_name(part, findings);
        // As the daemon reads them, up to a NUL.
        if (!seen.emplace(part.package.c_str(), part.name.c_str()).second) {
            findings.error(place_of(part), "is given twice; the daemon takes the last one");
        }
        if (!is_own(part, "FilterConfig")) continue;
        has_filters = true;
        lint_filters(part, findings);
    }
    lint_actions(parts, findings);
    const lint_place whole = {path, 0, ""};
    if (!has_filters) {
        findings.warning(whole,
                         "there is no kivd:FilterConfig; the daemon keeps everything, and at "
                         "its next start it takes the system's first configuration, if there "
                         "is one");
    }
    if (seen.size() >= max_list_records) {
        findings.error(whole, "there are " + std::to_string(seen.size()) +
                                  " parts; the daemon's list of them has fewer than " +
                                  std::to_string(max_list_records) +
                                  " records, the others are lost at its next start");
    }
}

int run_config_lint(const std::vector<std::string>& arguments, std::ostream& out,
                    std::ostream& err) {
    lint_findings findings;
    std::vector<part_content> given;
    bool all_given = true;
    std::vector<std::string> problems;
    for (const std::string& argument : arguments) {
        if (const auto source = read_part_argument(argument)) {
            const std::string problem = read_part(*source, given.emplace_back());
            if (problem.empty()) continue;
            problems.push_back(problem);
            all_given = false;
            continue;
        }
        std::string bytes;
        const std::string problem = read_whole_file(argument, max_package_size, bytes);
        if (!problem.empty()) {
            problems.push_back(printable(argument) + ": " + problem);
            continue;
        }
        lint_findings about_file;
        std::vector<part_content> parts;
        read_config_file(argument, bytes, parts, about_file);
        if (!about_file.has_errors()) lint_config(parts, argument, about_file);
        findings.append(std::move(about_file));
    }
    if (!given.empty() && all_given) {
        lint_config(given, "configuration", findings);
        lint_size(given, "configuration", findings);
    }
    findings.print(out);
    out.flush();
    for (const std::string& problem : problems) err << "kivtool: " << problem << '\n';
    if (!out) err << "kivtool: the output could not be written\n";
    return problems.empty() && !findings.has_errors() && out ? 0 : 1;
}

}  // namespace kivd
