// The names of the options, as getopt_long takes them.
#pragma once

#include <getopt.h>

#include <array>
#include <cstddef>
#include <iterator>

namespace kivd {

inline constexpr option long_options[] = {
#define KIV_OPTION(letter, name, takes, ...) {name, takes, nullptr, letter},
#include "daemon/option_table.def"
#undef KIV_OPTION
    {nullptr, 0, nullptr, 0},
};

// The letters as text, those that take an argument with a colon behind them.
inline constexpr auto short_options = [] {
    std::array<char, 2 * std::size(long_options)> text = {};
    size_t size = 0;
    for (const option& each : long_options) {
        if (each.val > 0x7F) continue;
        text[size++] = static_cast<char>(each.val);
        if (each.has_arg == required_argument) text[size++] = ':';
    }
    return text;
}();

inline constexpr char no_encryption[] = "NO_ENCRYPTION";  // in place of the directory of -c

}  // namespace kivd
