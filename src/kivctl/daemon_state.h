// The state of a daemon, from its directory, /proc and its answers. A missing value cannot be known
// from here, mostly for lack of permission; nothing is guessed.
#pragma once

#include <cstdint>
#include <ctime>
#include <optional>
#include <string>
#include <vector>

#include "kivctl/key_check.h"
#include "kivctl/process_facts.h"
#include "kivctl/questions.h"

namespace kivd {

// What the daemon has saved in private/kivd.state.
struct saved_state {
    time_t saved_at = 0;
    std::optional<bool> is_collecting;
    uint32_t max_report_size = 0;
    uint32_t max_output_dir_size = 0;
    std::optional<std::string> checksum;
    int64_t error_nr = 0;
    time_t error_time = 0;
};

struct output_facts {
    uint64_t size = 0;  // of all that counts towards the limit
    int64_t reports = 0;
    int32_t lowest = 0;  // 0 without reports
    int32_t highest = 0;
    bool has_marker = false;
    std::vector<std::string> bad_names;  // neither reports nor the daemon's own
};

struct space_facts {
    uint64_t bytes = 0;
    std::optional<uint64_t> inodes;  // missing where the file system doesn't count them
};

struct error_guard_facts {
    int64_t used = 0;             // of error_period_limit
    time_t suppressed_until = 0;  // 0: not suppressed
    time_t saved_at = 0;          // the daemon may have met more errors since
};

enum class key_source : uint8_t { given, command_line, usual, assumed, unknown };

struct key_facts {
    key_source source = key_source::unknown;  // of the directory
    std::string report_key_path;              // empty when unknown or switched off
    std::string config_key_path;
    key_verdict report_key = key_verdict::unknown;
    key_verdict config_key = key_verdict::unknown;
};

struct daemon_state {
    process_facts process;
    int answer = 0;  // 0 when it answers, else the error of libkiv
    std::optional<int64_t> answer_us;
    std::optional<saved_state> saved;
    std::optional<bool> has_diagnostics;
    std::optional<uint64_t> partial_size;
    std::optional<output_facts> output;
    std::optional<space_facts> space;
    std::optional<uint64_t> space_needed;
    std::optional<uint32_t> output_budget;
    key_facts keys;
    std::optional<std::string> checksum;  // of the configuration, 40 hexadecimal digits
    std::optional<error_guard_facts> error_guard;
};

// Makes the daemon's directory the current one. False, with errno set, when that fails.
[[nodiscard]] bool enter_base(const std::string& base);

// Looks at the daemon of the current directory. Throws a failure when `user` does not exist.
[[nodiscard]] daemon_state gather_state(daemon_questions& questions,
                                        const std::optional<std::string>& key_directory,
                                        const std::string& user);

}  // namespace kivd
