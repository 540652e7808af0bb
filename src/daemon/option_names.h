// The names of the options, as getopt_long takes them.
#pragma once

#include <getopt.h>

namespace kivd {

// Options that have no short letter.
inline constexpr int socket_delays_option = 256;
inline constexpr int verify_config_option = 257;
inline constexpr int encrypt_option = 258;

inline constexpr option long_options[] = {
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
    {"verify-config", required_argument, nullptr, verify_config_option},
    {"encrypt", required_argument, nullptr, encrypt_option},
    {"socket-delays", required_argument, nullptr, socket_delays_option},
    {nullptr, 0, nullptr, 0},
};

inline constexpr char short_options[] = "vb:htDZs:dCe:c:";

inline constexpr char no_encryption[] = "NO_ENCRYPTION";  // in place of the directory of -c

}  // namespace kivd
