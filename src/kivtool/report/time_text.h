// Times in reports as people read them, in UTC.
#pragma once

#include <cstdint>
#include <string>

namespace kivd {

// `format` is that of strftime. A time before 1970 or behind the year 9999 is "N ms".
[[nodiscard]] std::string time_text(int64_t ms, const char* format = "%Y-%m-%d %H:%M:%S");

}  // namespace kivd
