#include "daemon/options.h"

#include <getopt.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>

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
    "  -h, --help             give this help list\n"
    "  -b  <base_dir>         use specified base directory\n"
    "  -v, --verbose          emit debugging messages\n"
    "  -t, --test-mode        enter reproducable test mode\n"
    "  -D, --no-detach        don't detach from tty\n"
    "  -Z, --no-compress      don't compress output\n"
    "  -s, --save-interval    save interval in seconds for counters and static data\n"
    "  -d, --enable-di        enables the debug interface\n"
    "  -C, --enable-dc        enables data collection\n"
    "  -e, --expire-data <t>  expire data after <t> seconds. Can be overridden by configuration.\n"
    "  -c, --cert-path        use certificates from this path. NO_ENCRYPTION to turn off "
    "encryption.\n";

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
}

// Where the files of the command-line operations are looked for; they go on where it fails.
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

}  // namespace

options parse_options(int argc, char** argv) {
    options given = {KIV_DEFAULT_DIRECTORY, true, false};
    bool help = false;
    const char* verified_file = nullptr;
    const char* encrypted_file = nullptr;
    int letter = 0;
    while ((letter = getopt_long(argc, argv, short_options, long_options, nullptr)) != -1) {
        switch (letter) {
            case 'b':
                given.base_directory = optarg;
                break;
            case 'h':
                help = true;
                break;
            case 't':
                enable_test_mode();
                break;
            case 'D':
                given.detach = false;
                break;
            case 'Z':
                set_output_compression(false);
                break;
            case 's':
                if (const int32_t seconds = parse_saturated(optarg); seconds >= 1) {
                    set_save_interval(seconds);
                }
                break;
            case 'd':
                given.debug_interface = true;
                break;
            case 'C':
                set_data_collection(true);
                break;
            case 'e':
                set_expire_age(optarg);
                break;
            case 'c':
                set_certificate_path(optarg);
                break;
            case verify_config_option:
                verified_file = optarg;
                break;
            case encrypt_option:
                encrypted_file = optarg;
                break;
            case socket_delays_option:
                set_socket_delays(optarg);
                break;
            default:  // -v has no effect; what is unknown has been complained of
                break;
        }
    }
    if (help) {
        puts(usage);
        exit(2);
    }
    if (verified_file != nullptr) {
        enter_base_directory(given.base_directory);
        exit(verify_config_command(verified_file) ? verified_status : not_verified_status);
    }
    if (encrypted_file != nullptr) {
        enter_base_directory(given.base_directory);
        debug_encrypt(encrypted_file);
        exit(0);
    }
    return given;
}

}  // namespace kivd
