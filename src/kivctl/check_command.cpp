#include "kivctl/check_command.h"

#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <vector>

#include "daemon/option_names.h"
#include "diag/diag_store.h"
#include "kivctl/daemon_state.h"
#include "kivctl/directory_faults.h"
#include "kivctl/file_rights.h"
#include "kivctl/io.h"
#include "report/output_dir.h"
#include "toolkit/json.h"
#include "toolkit/text_escape.h"
#include "util/paths.h"

namespace kivd {
namespace {

struct facts {
    daemon_state state;
    left_files left;
    fault_list lists, filters, sockets;
    std::string given_key_directory;
};

using lines = std::vector<std::string>;

// Unknown facts give an unknown result.
template <class type>
fault_list if_known(const std::optional<type>& known, auto describe) {
    return known ? fault_list(describe(*known)) : std::nullopt;
}

lines one_if(bool is_found, const std::string& text) { return is_found ? lines{text} : lines(); }

fault_list find_no_answer(const facts& f) {
    if (f.state.answer == 0) return lines();
    const auto& [is_lock_held, is_running, pid, is_stopped, arguments, user] = f.state.process;
    if (is_running == false) return lines{"no daemon runs"};
    if (is_stopped == true) {
        return lines{"process " + std::to_string(*pid) + " is stopped and does not answer"};
    }
    return lines{std::string("the daemon does not answer: ") + strerror(-f.state.answer)};
}

fault_list find_marker(const facts& f) {
    return if_known(f.state.output, [](const output_facts& output) {
        return one_if(output.has_marker, std::string(paths::disable_marker) + " exists");
    });
}

fault_list find_collection(const facts& f) {
    if (!f.state.saved) return std::nullopt;
    return if_known(f.state.saved->is_collecting,
                    [](bool is_on) { return one_if(!is_on, "data collection is off"); });
}

fault_list find_open_lock(const facts& /*all*/) {
    return one_if(is_open_to_all(paths::lock_file, S_IROTH | S_IWOTH),
                  std::string("every user can open ") + paths::lock_file);
}

fault_list find_certificate_path(const facts& f) {
    return if_known(f.state.process.arguments, [&f](const daemon_arguments& arguments) {
        const std::string used = arguments.key_directory.value_or(paths::default_key_dir);
        lines found;
        if (used != no_encryption && !used.ends_with('/')) {
            found.push_back("the directory of -c has no final \"/\": the daemon looks for " + used +
                            paths::report_key_name + " and " + used + paths::config_key_name);
        }
        if (!f.given_key_directory.empty() && used != f.given_key_directory) {
            found.push_back("the daemon looks for its keys by -c " + used + ", not in " +
                            f.given_key_directory);
        }
        return found;
    });
}

// Without a daemon nobody knows where it would look for keys.
bool is_known(const key_facts& keys, key_verdict verdict) {
    return verdict != key_verdict::unknown && keys.source != key_source::assumed;
}

fault_list find_key_off(const key_facts& keys, key_verdict verdict, const std::string& path) {
    if (!is_known(keys, verdict)) return std::nullopt;
    if (verdict == key_verdict::switched_off) return lines{"-c NO_ENCRYPTION is given"};
    if (verdict == key_verdict::missing) return lines{path + " is missing"};
    return one_if(verdict == key_verdict::unreadable,
                  path + " cannot be read by the daemon's user");
}

fault_list find_key_unusable(const key_facts& keys, key_verdict verdict, const std::string& path,
                             const char* kind) {
    if (!is_known(keys, verdict)) return std::nullopt;
    return one_if(verdict == key_verdict::unusable, path + " is no " + kind);
}

fault_list find_bad_files(const facts& f) {
    return if_known(f.state.output, [](const output_facts& output) {
        lines found;
        for (const std::string& name : output.bad_names) {
            found.push_back(paths::output_dir + name + " is no report");
        }
        return found;
    });
}

fault_list find_near_limit(const char* what, std::optional<uint64_t> size,
                           std::optional<uint64_t> limit) {
    if (!size || !limit) return std::nullopt;
    constexpr uint64_t percent = 90;
    return one_if(*size * 100 >= *limit * percent, std::string(what) + " has " +
                                                       std::to_string(*size) + " of at most " +
                                                       std::to_string(*limit) + " bytes");
}

fault_list find_full_partial(const facts& f) {
    const auto& saved = f.state.saved;
    return find_near_limit(paths::events, f.state.partial_size,
                           saved ? std::optional(saved->max_report_size) : std::nullopt);
}

fault_list find_full_output(const facts& f) {
    const auto& output = f.state.output;
    return find_near_limit(paths::output_dir, output ? std::optional(output->size) : std::nullopt,
                           f.state.output_budget);
}

fault_list find_short_space(const facts& f) {
    const auto& [saved, space] = std::pair(f.state.saved, f.state.space);
    if (!saved || !space) return std::nullopt;
    const uint64_t least = compaction_space(saved->max_report_size);
    const uint64_t needed = f.state.space_needed.value_or(least);
    if (space->inodes && *space->inodes < free_inodes_min) {
        return lines{"only " + std::to_string(*space->inodes) + " inodes are free"};
    }
    if (space->bytes < needed) {
        return lines{"only " + std::to_string(space->bytes) + " bytes are free, of " +
                     std::to_string(needed) + " that are needed"};
    }
    const bool is_enough = f.state.space_needed || space->bytes >= least + diag_reserved_space;
    return is_enough ? fault_list(lines()) : std::nullopt;
}

fault_list find_full_guard(const facts& f) {
    return if_known(f.state.error_guard, [](const error_guard_facts& guard) {
        return one_if(guard.suppressed_until != 0,
                      "the daemon has used up its " + std::to_string(guard.used) + " error events");
    });
}

struct check {
    const char* id;
    fault_list (*look)(const facts&);
    const char* why;
    const char* remedy;
};
// clang-format off
constexpr check checks[] = {
    {"no_answer", find_no_answer,
     "nothing is collected",
     "start kivd, have it go on (SIGCONT) if it is stopped, and look at its log"},
    {"disabled", find_marker,
     "at its next start the daemon will serve nothing",
     "remove the file unless the device is to stay silent, and start the daemon again"},
    {"collection_off", find_collection,
     "what programs send is dropped without a word",
     "kivctl collection on"},
    {"socket", [](const facts& f) { return f.sockets; },
     "programs cannot reach the daemon as they should",
     "start the daemon again, and find out who changed it"},
    {"lock_file", find_open_lock,
     "whoever opens it can lock it, and the daemon would not start again",
     "start the daemon with a umask of 0077, or chmod 600 the file each time"},
    {"cert_path", find_certificate_path,
     "keys that are elsewhere protect nothing",
     "give the directory of the keys to -c, with the final \"/\", and start the daemon again"},
    {"report_key_off",
     [](const facts& f) { return find_key_off(f.state.keys, f.state.keys.report_key, f.state.keys.report_key_path); },
     "reports are not sealed: whoever gets one can read it",
     "let the daemon read the public report key there"},
    {"report_key_unusable",
     [](const facts& f) {
         return find_key_unusable(f.state.keys, f.state.keys.report_key, f.state.keys.report_key_path,
                                  "public RSA key in PEM form of at most 4096 bits");
     },
     "no reports are made at all",
     "put the public report key there"},
    {"config_key_off",
     [](const facts& f) { return find_key_off(f.state.keys, f.state.keys.config_key, f.state.keys.config_key_path); },
     "configurations are taken without a signature",
     "let the daemon read the public configuration key there"},
    {"config_key_unusable",
     [](const facts& f) {
         return find_key_unusable(f.state.keys, f.state.keys.config_key, f.state.keys.config_key_path,
                                  "public key in PEM form that SHA-1 signatures can be checked with");
     },
     "no configuration is taken at all",
     "put the public configuration key there"},
    {"filter", [](const facts& f) { return f.filters; },
     "everything of that kind is kept",
     "look for errors of kivd-filter in the log, mend the filter and hand the configuration over again"},
    {"list_file", [](const facts& f) { return f.lists; },
     "at its next start the daemon drops what comes behind, and a filter keeps everything but what was read",
     "hand over a configuration that keeps within the limits, or have programs use fewer and shorter names"},
    {"stale_temporary", [](const facts& f) { return f.left.temporary; },
     "something was given up half way, and what is left takes up room and may not be encrypted",
     "look for the error in the log, then remove the file"},
    {"unsent_report", [](const facts& f) { return f.left.unsent; },
     "a report could not be made of it, and the next one takes its place",
     "look for errors of kivd-compactor in the log; save the file first if it is needed"},
    {"bad_file", find_bad_files,
     "it counts towards the size limit and is never deleted for room",
     "remove it"},
    {"partial_file", find_full_partial,
     "the next events make a report of it; if it stays like this, reports cannot be made",
     "look again, and if it has not become smaller, look for errors of kivd-compactor in the log"},
    {"output_size", find_full_output,
     "each new report deletes the oldest ones, collected or not",
     "collect the reports and remove them (kivctl remove-report), or raise max_output_dir_size"},
    {"free_space", find_short_space,
     "the daemon deletes reports to make room, and makes none while there is too little",
     "make room on the file system of output/"},
    {"error_guard", find_full_guard,
     "errors go to the log only, and reports do not show them",
     "look at the log for what fails so often"},
};
// clang-format on

struct finding {
    std::string id, what, why, remedy;
};

struct findings {
    std::vector<finding> found;
    std::vector<std::string> not_checked;  // ids
};

findings look_at(const facts& all) {
    findings result;
    for (const check& each : checks) {
        const fault_list faults = each.look(all);
        if (!faults) result.not_checked.emplace_back(each.id);
        for (const std::string& what : faults.value_or(lines())) {
            result.found.push_back({each.id, what, each.why, each.remedy});
        }
    }
    if (result.not_checked.empty()) return result;
    std::string what = "could not be looked at:";
    for (const std::string& id : result.not_checked) what += " " + id;
    result.found.push_back({"not_checked", what, "what is weak there stays unseen",
                            "run this as root or as the daemon's user, while the daemon runs"});
    return result;
}

facts gather(const check_options& options) {
    facts all;
    if (!options.key_directory.empty()) {
        std::string directory = std::filesystem::absolute(options.key_directory);
        if (!directory.ends_with('/')) directory += '/';
        all.given_key_directory = directory;
    }
    if (!enter_base(options.base)) {
        all.state.answer = -errno;
        return all;
    }
    daemon_questions questions(options.timeout_ms);
    all.state = gather_state(
        questions,
        all.given_key_directory.empty() ? std::nullopt : std::optional(all.given_key_directory),
        options.user);
    all.left = find_left_files(questions, all.state.process);
    all.lists = find_list_faults();
    all.filters = find_filter_faults(questions);
    all.sockets = all.state.answer == 0 ? find_socket_faults() : lines();
    return all;
}

void print_text(const findings& result) {
    if (result.found.empty()) print_line("all is well");
    for (const auto& [id, what, why, remedy] : result.found) {
        std::string line = id + ": ";
        line += printable(what, std::string::npos);
        for (const std::string& part : {"; " + why, "; to do: " + remedy}) line += part;
        print_line(line.c_str());
    }
}

void print_json(const findings& result, const check_options& options, bool is_alive) {
    json found = json::array();
    for (const auto& [id, what, why, remedy] : result.found) {
        found.push_back({{"id", id}, {"what", json_text(what)}, {"why", why}, {"to_do", remedy}});
    }
    const json all = {{"directory", json_text(options.base)},
                      {"answers", is_alive},
                      {"findings", found},
                      {"not_checked", result.not_checked}};
    print_line(all.dump().c_str());
}

}  // namespace

int run_check(const check_options& options) {
    const facts all = gather(options);
    const findings result = look_at(all);
    const bool is_alive = all.state.answer == 0;
    if (options.is_json) {
        print_json(result, options, is_alive);
    } else {
        print_text(result);
    }
    if (!is_alive) return status_unreachable;
    return result.found.empty() ? status_done : status_refused;
}

}  // namespace kivd
