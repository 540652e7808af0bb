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
    explicit property(const char* name) { property_get(name, value_, "unknown"); }
    [[nodiscard]] bool is_known() const { return get() != "unknown"; }
    [[nodiscard]] std::string_view get() const { return value_; }

 private:
    char value_[PROPERTY_VALUE_MAX];
};

void set_from_properties(auto& field, const char* name, const char* fallback) {
    field.set(property(name).get());
    if (!field.is_known() && fallback != nullptr) field.set(property(fallback).get());
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

template <auto field>
void set_text(header_record& header, const char* value) {
    auto& text = header.*field;
    if (const std::string_view word = scan_word(value, text.capacity); !word.empty()) {
        text.set(word);
    }
}

void set_timezone(header_record& header, const char* value) {
    if (const auto number = scan_number(value)) header.timezone = saturate_int32(*number);
}

void add_group(header_record& header, const char* value) {
    const std::string_view word = scan_word(value, group_id_compared);
    if (!word.empty()) add_group_id(header.groups, word);
}

struct line_pattern {
    std::string_view key;
    void (*apply)(header_record& header, const char* value);
};
// clang-format off
constexpr line_pattern line_patterns[] = {
    {"id:",          set_text<&header_record::product_id>},
    {"revision:",    set_text<&header_record::software_version>},
    {"variant:",     set_text<&header_record::software_variant>},
    {"type:",        set_text<&header_record::build_type>},
    {"timezone:",    set_timezone},
    {"device id:",   set_text<&header_record::device_id>},
    {"cdf_id:",      set_text<&header_record::cdf_id>},
    {"serial num:",  set_text<&header_record::serial_number>},
    {"device imei:", set_text<&header_record::device_imei>},
    {"group id:",    add_group},
};
// clang-format on

void apply_header_info(header_record& candidate) {
    const unique_file file = open_to_read(paths::header_info);
    if (!file) return;
    char line[line_size];
    while (fgets(line, sizeof line, file.get()) != nullptr) {
        for (const line_pattern& pattern : line_patterns) {
            const char* const value = scan_key(line, pattern.key);
            if (value != nullptr) pattern.apply(candidate, value);
        }
    }
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
    init_header(candidate);
    set_from_properties(candidate.product_id, "ro.qeli.version.sw", "ro.build.product_id");
    set_from_properties(candidate.software_version, "ro.qeli.version.sw_revision", "ro.build.id");
    set_from_properties(candidate.software_variant, "ro.qeli.version.sw_variant", nullptr);
    set_from_properties(candidate.build_type, "ro.qeli.version.sw_type", "ro.build.type");
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
    header.product_id.set("test_id");
    header.software_version.set("test_rev");
    header.software_variant.set("test_var");
    header.device_id.set("2543c433-e716-46bb-a9f4-44481a876b6e");
    header.build_type.set("eng");
    header.config_checksum.set("fedcba9876543210fedcba9876543210fedcba98");
    header.report_uuid.set("");
    header.timezone = 0;
    header.cdf_id.set("1234-5678_R6D");
    header.serial_number.set("ABCDEFGHIJ");
    header.device_imei.set("1234567890");
}

}  // namespace kivd
