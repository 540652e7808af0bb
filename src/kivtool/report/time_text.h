// Times in reports for people, in UTC.
#pragma once

#include <cstdint>
#include <string>

namespace kivd {

// `format` is that of strftime. A time before 1970 or after 9999 becomes "N ms".
[[nodiscard]] std::string time_text(int64_t ms, const char* format = "%Y-%m-%d %H:%M:%S");

}  // namespace kivd
