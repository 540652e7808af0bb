#include "daemon/options.h"

#include <getopt.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <iterator>

#include "config/limits.h"
#include "daemon/loop/save_clock.h"
#include "daemon/net/delays.h"
#include "daemon/option_names.h"
#include "platform/android_log.h"
#include "report/report_generation.h"
#include "report/state_file.h"
#include "runtime/daemon_error.h"
#include "security/debug_encrypt.h"
#include "security/key_paths.h"
#include "security/verify_config_command.h"
#include "util/clock.h"
#include "util/numbers.h"
#include "util/paths.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd";

// Exit statuses of `--verify-config`.
constexpr int verified_status = 42;
constexpr int not_verified_status = 33;

constexpr char usage[] =
    "Syntax: kivd [OPTIONS]\n"
    "\n"
#define KIV_OPTION(letter, name, takes, action, usage_line) usage_line
#include "daemon/option_table.def"
#undef KIV_OPTION
    ;

struct command_line : options {
    bool asks_help;
    const char* verified_file;   // null: none
    const char* encrypted_file;  // null: none
};

void set_interval(const char* text) {
    const int32_t seconds = parse_saturated(text);
    if (seconds >= 1) set_save_interval(seconds);
}

void set_expire_age(const char* seconds) {
    const auto age = static_cast<uint32_t>(parse_saturated(seconds));
    limits& base = get_base_limits();
    base.expire_counters_age = base.expire_sdata_age = age;
    get_limits() = base;
}

void set_certificate_path(const char* path) {
    if (strcmp(path, no_encryption) == 0) {
        clear_report_key_path();
        clear_config_key_path();
        return;
    }
    if (access(path, F_OK) != 0) {
        __android_log_print(ANDROID_LOG_ERROR, tag, "Certificate path does not exist!");
        exit(1);
    }
    // Made absolute, since it is read from another directory than it was checked in.
    char directory[4096] = "";
    if (*path != '/' && getcwd(directory, sizeof directory) == nullptr) *directory = '\0';
    const size_t size = strlen(directory);
    snprintf(directory + size, sizeof directory - size, "%s%s", size > 0 ? "/" : "", path);
    set_report_key_dir(directory);
    set_config_key_dir(directory);
    if (is_sealing_on() || is_verification_on()) return;
    __android_log_print(ANDROID_LOG_WARN, tag, "No key can be read in %s: is the last / missing?",
                        directory);
}

// Where the files of the command-line operations are looked for; on failure we stay where we are.
void enter_base_directory(const char* directory) {
    if (chdir(directory) == 0) {
        daemon_error_init(paths::working_dir);
        return;
    }
    __android_log_print(ANDROID_LOG_ERROR, tag, "Failed to chdir(%s), %s\n", directory,
                        strerror(errno));
}

// "R" or "R:S", in milliseconds.
void set_socket_delays(const char* delays) {
    set_receive_delay(std::max(parse_saturated(delays), 0));
    const char* const colon = strchr(delays, ':');
    if (colon != nullptr) set_send_delay(std::max(parse_saturated(colon + 1), 0));
}

struct option_action {
    int letter;
    void (*run)(command_line& line, const char* argument);
};
constexpr option_action option_actions[] = {
#define KIV_OPTION(letter, name, takes, action, usage_line) \
    {letter,                                                \
     []([[maybe_unused]] command_line& line, [[maybe_unused]] const char* argument) { action; }},
#include "daemon/option_table.def"
#undef KIV_OPTION
};

command_line read_command_line(int argc, char** argv) {
    command_line line = {{KIV_DEFAULT_DIRECTORY, true, false}, false, nullptr, nullptr};
    int letter = 0;
    while ((letter = getopt_long(argc, argv, short_options.data(), long_options, nullptr)) != -1) {
        const auto* const found = std::ranges::find(option_actions, letter, &option_action::letter);
        // getopt_long has complained of what is unknown.
        if (found != std::end(option_actions)) found->run(line, optarg);
    }
    return line;
}

}  // namespace

options parse_options(int argc, char** argv) {
    const command_line line = read_command_line(argc, argv);
    if (line.asks_help) {
        puts(usage);
        exit(2);
    }
    if (line.verified_file != nullptr) {
        enter_base_directory(line.base_directory);
        exit(verify_config_command(line.verified_file) ? verified_status : not_verified_status);
    }
    if (line.encrypted_file != nullptr) {
        enter_base_directory(line.base_directory);
        debug_encrypt(line.encrypted_file);
        exit(0);
    }
    return line;
}

}  // namespace kivd
