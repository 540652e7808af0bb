#include "kivtool/report/time_text.h"

#include <ctime>

namespace kivd {

std::string time_text(int64_t ms, const char* format) {
    constexpr int64_t end_of_year_9999_ms = 253402300800000;
    if (ms < 0 || ms >= end_of_year_9999_ms) return std::to_string(ms) + " ms";
    const auto seconds = static_cast<time_t>(ms / 1000);
    tm utc{};
    char text[32];
    gmtime_r(&seconds, &utc);
    return {text, strftime(text, sizeof text, format, &utc)};
}

}  // namespace kivd
