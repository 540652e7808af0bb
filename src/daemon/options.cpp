#include "daemon/options.h"

#include <getopt.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "config/limits.h"
#include "daemon/net/delays.h"
#include "daemon/save_clock.h"
#include "platform/android_log.h"
#include "report/report_generation.h"
#include "report/state_file.h"
#include "util/clock.h"
#include "util/numbers.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd";

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

constexpr int socket_delays_option = 256;  // has no short letter

constexpr option long_options[] = {
    {"verbose", no_argument, nullptr, 'v'},
    {"basedir", required_argument, nullptr, 'b'},
    {"help", no_argument, nullptr, 'h'},
    {"test-mode", no_argument, nullptr, 't'},
    {"no-detach", no_argument, nullptr, 'D'},
    {"no-compress", no_argument, nullptr, 'Z'},
    {"save-interval", required_argument, nullptr, 's'},
    {"expire-data", required_argument, nullptr, 'e'},
    {"enable-di", no_argument, nullptr, 'd'},
    {"enable-dc", no_argument, nullptr, 'C'},
    {"cert-path", required_argument, nullptr, 'c'},
    {"socket-delays", required_argument, nullptr, socket_delays_option},
    {nullptr, 0, nullptr, 0},
};

void set_expire_age(const char* seconds) {
    const auto age = static_cast<uint32_t>(parse_saturated(seconds));
    limits& values = get_limits();
    values.expire_counters_age = values.base_expire_counters_age = age;
    values.expire_sdata_age = values.base_expire_sdata_age = age;
}

void check_certificate_path(const char* path) {
    if (strcmp(path, "NO_ENCRYPTION") == 0 || access(path, F_OK) == 0) return;
    __android_log_print(ANDROID_LOG_ERROR, tag, "Certificate path does not exist!");
    exit(1);
}

// "R" or "R:S", in milliseconds.
void set_socket_delays(const char* delays) {
    set_receive_delay(std::max(parse_saturated(delays), 0));
    const char* const colon = strchr(delays, ':');
    if (colon != nullptr) set_send_delay(std::max(parse_saturated(colon + 1), 0));
}

}  // namespace

options parse_options(int argc, char** argv) {
    options given = {KIV_DEFAULT_DIRECTORY, true};
    bool help = false;
    int letter = 0;
    while ((letter = getopt_long(argc, argv, "vb:htDZs:dCe:c:", long_options, nullptr)) != -1) {
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
            case 'C':
                set_data_collection(true);
                break;
            case 'e':
                set_expire_age(optarg);
                break;
            case 'c':
                check_certificate_path(optarg);
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
    return given;
}

}  // namespace kivd
