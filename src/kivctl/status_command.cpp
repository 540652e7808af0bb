#include "kivctl/status_command.h"

#include <cerrno>
#include <cstring>
#include <ctime>

#include "kivctl/daemon_state.h"
#include "kivctl/io.h"
#include "runtime/daemon_error.h"
#include "toolkit/json.h"
#include "toolkit/text_escape.h"

namespace kivd {
namespace {

constexpr char unknown[] = "unknown";

std::string number(std::optional<uint64_t> value) {
    return value ? std::to_string(*value) : unknown;
}

std::string on_or_off(std::optional<bool> value) {
    return value ? (*value ? "on" : "off") : unknown;
}

std::string share(std::optional<uint64_t> size, std::optional<uint64_t> limit) {
    std::string text = number(size) + " of " + number(limit) + " bytes";
    if (size && limit && *limit > 0) text += " (" + std::to_string(*size * 100 / *limit) + " %)";
    return text;
}

std::string local_time(time_t time) {
    tm local = {};
    char text[40];
    (void)localtime_r(&time, &local);
    (void)strftime(text, sizeof text, "%Y-%m-%d %H:%M:%S", &local);
    return text;
}

std::string describe_process(const process_facts& process) {
    if (!process.is_running) return unknown;
    if (!*process.is_running) {
        return process.is_lock_held == true
                   ? "no, but a child of the last one still holds the lock and makes a report"
                   : "no";
    }
    std::string text = "yes, process " + number(process.pid);
    if (process.is_stopped == true) text += ", stopped by a signal or a debugger";
    return text;
}

std::string describe_answer(const daemon_state& state, unsigned timeout_ms) {
    if (state.answer == 0) {
        char text[40];
        snprintf(text, sizeof text, "yes, in %.3f ms", static_cast<double>(*state.answer_us) / 1e3);
        return text;
    }
    if (state.answer == -ETIMEDOUT) return "no, not within " + std::to_string(timeout_ms) + " ms";
    return std::string("no: ") + strerror(-state.answer);
}

std::string describe_reports(const std::optional<output_facts>& output) {
    if (!output) return unknown;
    if (output->reports == 0) return "none";
    return std::to_string(output->reports) + ", kiv_" + std::to_string(output->lowest) +
           " to kiv_" + std::to_string(output->highest);
}

std::string describe_space(const daemon_state& state) {
    if (!state.space) return unknown;
    std::string text = number(state.space->bytes) + " bytes";
    if (state.space->inodes) text += " and " + number(state.space->inodes) + " inodes";
    return text + ", needed: " + number(state.space_needed) + " bytes";
}

struct verdict_text {
    key_verdict verdict;
    const char* name;  // in JSON
    std::optional<bool> is_on;
    const char* text;  // with the path behind it, if there is one
};
constexpr verdict_text verdict_texts[] = {
    {key_verdict::unknown, "unknown", std::nullopt, "unknown"},
    {key_verdict::usable, "usable", true, "on, with "},
    {key_verdict::unusable, "unusable", true, "on, but there is no such key in "},
    {key_verdict::unreadable, "unreadable", false, "off: the daemon cannot read "},
    {key_verdict::missing, "missing", false, "off: there is no "},
    {key_verdict::switched_off, "switched_off", false, "off by -c NO_ENCRYPTION"},
};

struct source_text {
    key_source source;
    const char* name;
    const char* text;
};
constexpr source_text source_texts[] = {
    {key_source::given, "given", ""},
    {key_source::command_line, "command_line", ""},
    {key_source::usual, "default", ""},
    {key_source::assumed, "assumed",
     " (assumed: the daemon's command line, where -c may say otherwise, cannot be read)"},
    {key_source::unknown, "unknown", ""},
};

const verdict_text& text_of(key_verdict verdict) {
    return verdict_texts[static_cast<size_t>(verdict)];
}

const source_text& text_of(key_source source) { return source_texts[static_cast<size_t>(source)]; }

std::string describe_key(const key_facts& keys, key_verdict verdict, const std::string& path) {
    std::string text = text_of(verdict).text;
    if (verdict == key_verdict::unknown && !path.empty()) text += ", with ";
    return text + printable(path) + text_of(keys.source).text;
}

std::string describe_checksum(const std::optional<std::string>& checksum) {
    if (!checksum) return unknown;
    if (checksum->find_first_not_of('0') == std::string::npos) return "none has been taken";
    return printable(*checksum);
}

std::string describe_error_guard(const std::optional<error_guard_facts>& guard) {
    if (!guard) return unknown;
    std::string text = std::to_string(guard->used) + " of " + std::to_string(error_period_limit) +
                       " error events used";
    if (guard->suppressed_until != 0) {
        text += ", suppressed until " + local_time(guard->suppressed_until);
    }
    return text + ", as saved at " + local_time(guard->saved_at);
}

// A part of facts that may be unknown.
template <class type, class field_type>
std::optional<field_type> get(const std::optional<type>& facts, field_type type::*field) {
    return facts ? std::optional((*facts).*field) : std::nullopt;
}

std::optional<bool> collection(const daemon_state& state) {
    return state.saved ? state.saved->is_collecting : std::nullopt;
}

void print_text(const status_options& options, const daemon_state& state) {
    const std::pair<const char*, std::string> lines[] = {
        {"directory", printable(options.base)},
        {"running", describe_process(state.process)},
        {"answers", describe_answer(state, options.timeout_ms)},
        {"collection", on_or_off(collection(state))},
        {"diagnostics", on_or_off(state.has_diagnostics)},
        {"partial file",
         share(state.partial_size, get(state.saved, &saved_state::max_report_size))},
        {"reports", describe_reports(state.output)},
        {"output size", share(get(state.output, &output_facts::size), state.output_budget)},
        {"free space", describe_space(state)},
        {"sealing", describe_key(state.keys, state.keys.report_key, state.keys.report_key_path)},
        {"verification",
         describe_key(state.keys, state.keys.config_key, state.keys.config_key_path)},
        {"configuration", describe_checksum(state.checksum)},
        {"error guard", describe_error_guard(state.error_guard)},
    };
    std::string text;
    for (const auto& [name, value] : lines) {
        text += name;
        text.append(16 - strlen(name), ' ');
        text += value + '\n';
    }
    text.pop_back();
    print_line(text.c_str());
}

json json_of_key(const std::string& path, key_verdict verdict) {
    return {{"on", json_or_null(text_of(verdict).is_on)},
            {"key", text_of(verdict).name},
            {"path", path.empty() ? json() : json_text(path)}};
}

json json_of_error_guard(const std::optional<error_guard_facts>& guard) {
    const bool is_suppressed = guard && guard->suppressed_until != 0;
    return {{"used", json_or_null(get(guard, &error_guard_facts::used))},
            {"limit", error_period_limit},
            {"suppressed", guard ? json(is_suppressed) : json()},
            {"suppressed_until", is_suppressed ? json(guard->suppressed_until) : json()},
            {"saved_at", json_or_null(get(guard, &error_guard_facts::saved_at))}};
}

json to_json(const status_options& options, const daemon_state& state) {
    return {
        {"directory", json_text(options.base)},
        {"running", json_or_null(state.process.is_running)},
        {"pid", json_or_null(state.process.pid)},
        {"stopped", json_or_null(state.process.is_stopped)},
        {"lock_held", json_or_null(state.process.is_lock_held)},
        {"answers", state.answer == 0},
        {"answer_us", json_or_null(state.answer_us)},
        {"collection", json_or_null(collection(state))},
        {"diagnostics", json_or_null(state.has_diagnostics)},
        {"partial_file",
         {{"size", json_or_null(state.partial_size)},
          {"limit", json_or_null(get(state.saved, &saved_state::max_report_size))}}},
        {"reports",
         {{"count", json_or_null(get(state.output, &output_facts::reports))},
          {"lowest", json_or_null(get(state.output, &output_facts::lowest))},
          {"highest", json_or_null(get(state.output, &output_facts::highest))}}},
        {"output",
         {{"size", json_or_null(get(state.output, &output_facts::size))},
          {"limit", json_or_null(state.output_budget)}}},
        {"free_space",
         {{"size", json_or_null(get(state.space, &space_facts::bytes))},
          {"needed", json_or_null(state.space_needed)},
          {"inodes", state.space ? json_or_null(state.space->inodes) : json()}}},
        {"keys_from", text_of(state.keys.source).name},
        {"sealing", json_of_key(state.keys.report_key_path, state.keys.report_key)},
        {"verification", json_of_key(state.keys.config_key_path, state.keys.config_key)},
        {"config_checksum", json_or_null(state.checksum)},
        {"error_guard", json_of_error_guard(state.error_guard)},
    };
}

}  // namespace

int run_status(const status_options& options) {
    daemon_state state;
    if (enter_base(options.base)) {
        daemon_questions questions(options.timeout_ms);
        state = gather_state(questions, std::nullopt, "");
    } else {
        state.answer = -errno;
    }
    if (options.is_json) {
        print_line(to_json(options, state).dump().c_str());
    } else {
        print_text(options, state);
    }
    return state.answer == 0 ? status_done : status_unreachable;
}

}  // namespace kivd
