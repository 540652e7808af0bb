#include "kivtool/config/config_trial.h"

#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <system_error>
#include <vector>

#include "config/config_parts.h"
#include "config/filters.h"
#include "config/settings.h"
#include "daemon/modules.h"
#include "intake/intake.h"
#include "intake/run_actions.h"
#include "kivtool/config/filter_lint.h"
#include "kivtool/config/part_text.h"
#include "platform/recording_platform.h"
#include "toolkit/text_escape.h"
#include "util/bytes.h"
#include "util/paths.h"

namespace kivd {
namespace {

namespace fs = std::filesystem;

// In memory, if possible: a configuration may have 20,000 parts, each of which becomes a file.
fs::path place_for_trials() {
    const bool has_memory = getenv("TMPDIR") == nullptr && access("/dev/shm", W_OK) == 0;
    return has_memory ? fs::path("/dev/shm") : fs::temp_directory_path();
}

// The daemon's modules as after a first start, in a new directory, which is the current one as long
// as this lives.
class trial_daemon {
 public:
    trial_daemon() : previous_(fs::current_path()) {
        std::string name = place_for_trials() / "kivtool-XXXXXX";
        if (mkdtemp(name.data()) == nullptr) {
            throw std::system_error(errno, std::generic_category(), name);
        }
        own_ = name;
        for (const char* each : {paths::private_dir, paths::output_dir}) {
            fs::create_directory(own_ / each);
        }
        fs::current_path(own_);
        (void)start_modules();
    }
    ~trial_daemon() {
        release_modules();
        std::error_code ignored;
        fs::current_path(previous_, ignored);
        fs::remove_all(own_, ignored);
    }
    trial_daemon(const trial_daemon&) = delete;
    trial_daemon& operator=(const trial_daemon&) = delete;

 private:
    fs::path previous_;
    fs::path own_;
};

// Runs a step of the daemon; each of its complaints becomes an error.
void judge(const lint_place& place, lint_findings& findings, auto step) {
    (void)take_log();
    step();
    for (const std::string& line : take_log()) {
        const bool is_complaint = !line.starts_with("I ");
        if (!is_complaint || line.starts_with("E kivd-error: "))
            continue;  // there is no daemon to send errors to
        findings.error(place, "the daemon logs \"" + printable(line.substr(2)) + '"');
    }
}

// The last part of that name, which is the one that counts; null when there is none.
const part_content* find_own(std::span<const part_content> parts, std::string_view name) {
    const auto found = std::find_if(parts.rbegin(), parts.rend(), [name](const auto& part) {
        return part.package == daemon_package && part.name == name;
    });
    return found == parts.rend() ? nullptr : &*found;
}

// For each item of the filter, whether the probe of that name is kept.
std::vector<bool> find_matches(const written_filter& filter) {
    std::vector<bool> matches;
    for (const auto& item : filter.filter.item()) {
        matches.push_back(filter_match(filter.kind, item.package().c_str(), item.name().c_str()));
    }
    return matches;
}

void warn_of_nothing(const written_filter& filter, lint_findings& findings) {
    const auto matches = find_matches(filter);
    const bool is_other_kept = filter_match(filter.kind, "\x01", "\x01");
    if (is_other_kept || std::ranges::find(matches, true) != matches.end()) return;
    findings.warning(filter.place, std::string("the daemon keeps no ") + filter.things);
}

// -1 when there is none.
int first_difference(const std::vector<bool>& before, const std::vector<bool>& after) {
    const auto [at, ignored] = std::ranges::mismatch(before, after);
    return at == before.end() ? -1 : static_cast<int>(at - before.begin());
}

void try_restart(const std::vector<written_filter>& filters, const lint_place& whole,
                 lint_findings& findings) {
    std::vector<std::vector<bool>> matches;
    matches.reserve(filters.size());
    for (const written_filter& each : filters) matches.push_back(find_matches(each));
    bool has_event_filter = false;
    judge(whole, findings, [&] {
        release_modules();
        has_event_filter = start_modules();
    });

    for (size_t i = 0; i < filters.size(); ++i) {
        const int other = first_difference(matches[i], find_matches(filters[i]));
        if (other < 0) continue;
        findings.error(filters[i].place_of_item(other),
                       "from its next start on the daemon does the opposite with it, and perhaps "
                       "with others");
    }
    if (has_event_filter) return;
    findings.warning(whole,
                     "there is no filter of events that outlives a start of the daemon; it keeps "
                     "all events, and at its next start it takes the system's first configuration, "
                     "if there is one");
}

}  // namespace

void try_config(std::string_view bytes, std::span<const part_content> parts,
                const std::string& path, lint_findings& findings) {
    const lint_place whole = {path, 0, ""};
    const auto place_of_own = [&](const char* name) {
        const part_content* const part = find_own(parts, name);
        return part ? lint_place{part->path, 0, id_of(*part)} : whole;
    };
    const trial_daemon daemon;
    bool is_stored = false;
    judge(whole, findings, [&] { is_stored = store_configuration(bytes_of(bytes)); });
    if (!is_stored) return;
    judge(place_of_own("Settings"), findings, apply_settings);
    judge(place_of_own("FilterConfig"), findings, apply_filter_config);
    const bool was_disabled = fs::exists(paths::disable_marker);
    judge(place_of_own("RunActionsOnce"), findings, run_actions_once);
    if (was_disabled && !fs::exists(paths::disable_marker)) {
        findings.error(place_of_own("Settings"),
                       "permanently_disable together with remove_reports of kivd:RunActionsOnce, "
                       "which also removes the mark of a disabled daemon; the daemon stops until "
                       "its next start only");
    }
    fs::remove(paths::disable_marker);  // a disabled daemon would not start again
    const part_content* const filter_part = find_own(parts, "FilterConfig");
    const auto filters = filter_part ? filters_of(*filter_part) : std::vector<written_filter>();
    for (const written_filter& each : filters) warn_of_nothing(each, findings);
    try_restart(filters, whole, findings);
}

}  // namespace kivd
