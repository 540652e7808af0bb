#include "report/header_sources.h"

#include <unistd.h>

#include <cstdio>
#include <ctime>

#include "platform/system_properties.h"
#include "util/clock.h"
#include "util/file_io.h"
#include "util/numbers.h"
#include "util/paths.h"
#include "util/text_scan.h"

namespace kivd {
namespace {

constexpr size_t line_size = 256;
constexpr size_t cdf_id_limit = 62;

class property {
 public:
    explicit property(const char* name) { property_get(name, value_, unknown_value.data()); }
    [[nodiscard]] bool is_known() const { return get() != unknown_value; }
    [[nodiscard]] std::string_view get() const { return value_; }

 private:
    char value_[PROPERTY_VALUE_MAX];
};

void set_from_properties(header_record& candidate, const header_field& field) {
    for (const char* const name : {field.property, field.substitute}) {
        if (name != nullptr && !field.is_known(candidate)) {
            field.set(candidate, property(name).get());
        }
    }
}

void set_cdf_id(header_record& candidate) {
    const property customisation("ro.qeli.version.cust");
    if (!customisation.is_known()) return;
    const property revision("ro.qeli.version.cust_revision");
    if (!revision.is_known()) return candidate.cdf_id.set(customisation.get());

    char text[2 * PROPERTY_VALUE_MAX];
    const int size =
        snprintf(text, sizeof text, "%s_%s", customisation.get().data(), revision.get().data());
    candidate.cdf_id.set(std::string_view(text, static_cast<size_t>(size)).substr(0, cdf_id_limit));
}

void set_timezone(header_record& header, const char* value) {
    if (const auto number = scan_number(value)) header.timezone = saturate_int32(*number);
}

void add_group(header_record& header, const char* value) {
    const std::string_view word = scan_word(value, group_id_compared);
    if (!word.empty()) add_group_id(header.groups, word);
}

void apply_line(header_record& candidate, const char* line) {
    for (const header_field& field : header_fields) {
        if (const char* const value = scan_key(line, field.info_key)) {
            field.set_from_line(candidate, value);
        }
    }
    if (const char* const value = scan_key(line, "timezone:")) set_timezone(candidate, value);
    if (const char* const value = scan_key(line, "group id:")) add_group(candidate, value);
}

void apply_header_info(header_record& candidate) {
    const unique_file file = open_to_read(paths::header_info);
    if (!file) return;
    char line[line_size];
    while (fgets(line, sizeof line, file.get()) != nullptr) apply_line(candidate, line);
}

}  // namespace

bool has_header_info() { return is_test_mode() || access(paths::header_info, F_OK) == 0; }

int32_t local_utc_offset() {
    if (is_test_mode()) return -1;
    const time_t now = time(nullptr);
    tm local = {};
    localtime_r(&now, &local);
    return static_cast<int32_t>(local.tm_gmtoff);
}

void gather_header(header_record& candidate) {
    candidate = {};
    for (const header_field& field : header_fields) set_from_properties(candidate, field);
    set_cdf_id(candidate);
    candidate.timezone = local_utc_offset();
    apply_header_info(candidate);
}

void add_group_id_property(header_record& candidate) {
    if (has_header_info()) return;
    const property group("persist.sys.qeli.kivgroup");
    if (group.is_known()) add_group_id(candidate.groups, group.get());
}

void set_test_identity(header_record& header) {
    for (const header_field& field : header_fields) field.set(header, field.test_value);
    header.config_checksum.set("fedcba9876543210fedcba9876543210fedcba98");
    header.timezone = 0;
}

}  // namespace kivd
