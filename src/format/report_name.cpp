#include "format/report_name.h"

#include <cstdio>
#include <string_view>

#include "util/text_scan.h"

namespace kivd {

report_name::report_name(int64_t number) {
    snprintf(text, sizeof text, "%s%lld", report_prefix, static_cast<long long>(number));
}

std::optional<int32_t> scan_report_number(const char* name) {
    if (!std::string_view(name).starts_with(report_prefix)) return std::nullopt;
    const std::optional<int64_t> number = scan_number(name + sizeof report_prefix - 1);
    return number ? std::optional(static_cast<int32_t>(*number)) : std::nullopt;
}

std::optional<int32_t> parse_report_name(const char* name) {
    const std::optional<int32_t> number = scan_report_number(name);
    if (!number || *number <= 0 || std::string_view(name) != report_name(*number).text) {
        return std::nullopt;
    }
    return number;
}

}  // namespace kivd
