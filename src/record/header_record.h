// The report header, with which every report begins: it says who the device is. The header record
// holds the values in force; packed, it is a kiv.Report with only its field `header`.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <iterator>
#include <span>
#include <string_view>

#include "report.pb-c.h"

namespace kivd {

// A text of at most `limit` characters; longer ones are cut.
template <size_t limit>
class limited_text {
 public:
    static constexpr size_t capacity = limit;

    constexpr limited_text() = default;
    constexpr explicit limited_text(std::string_view text) { set(text); }

    constexpr void set(std::string_view text) {
        const size_t size = text.copy(text_.data(), limit);
        text_[size] = '\0';
    }
    [[nodiscard]] constexpr const char* get() const { return text_.data(); }

    bool operator==(const limited_text& other) const {
        return *this == std::string_view(other.get());
    }
    bool operator==(std::string_view text) const { return get() == text; }

 private:
    std::array<char, limit + 1> text_ = {};
};

inline constexpr size_t max_group_ids = 6;
inline constexpr size_t group_id_compared = 32;  // ids that agree so far are the same

using group_id = limited_text<33>;

// An ordered list of ids without duplicates; a new one goes to the end.
struct group_id_list {
    std::array<group_id, max_group_ids> ids;
    size_t count = 0;
};

using header_text = limited_text<63>;
inline constexpr std::string_view unknown_value = "unknown";

// The initial values: a text that still has its own is not known. Nothing in it is allocated, so
// filling it cannot fail.
struct header_record {
    header_text product_id{unknown_value};
    header_text software_version{unknown_value};
    header_text software_variant{unknown_value};
    header_text device_id{unknown_value};
    header_text build_type{unknown_value};
    header_text cdf_id{unknown_value};
    header_text serial_number{unknown_value};
    header_text device_imei;
    header_text config_checksum;  // 40 hexadecimal digits
    int32_t timezone = -1;        // seconds east of UTC
    group_id_list groups;
};

// What there is to know about a text of the header: where its values come from and go to.
struct header_field {
    header_text header_record::*text;
    char* Kiv__Header::*packed;
    size_t capacity;             // longer values are cut
    std::string_view state_key;  // of its line in the state file
    std::string_view info_key;   // of its line in header_info.conf
    const char* property;        // of the system; null: none
    const char* substitute;      // the property for when that one is not there; null: none
    std::string_view test_value;

    void set(header_record& header, std::string_view value) const;
    // Sets it to the first word of `line`, if there is one.
    void set_from_line(header_record& header, const char* line) const;
    [[nodiscard]] const char* get(const header_record& header) const;
    [[nodiscard]] bool is_known(const header_record& header) const;
};

// A row is all that a field needs to be gathered, remembered, compared and packed. The state file
// has their lines in this order, the first one before the sizes. Outside the table are the
// configuration checksum, the time zone, the group ids, and the two properties of the cdf_id.
// clang-format off
inline constexpr header_field header_fields[] = {
    {&header_record::device_id, &Kiv__Header::device_id, 40, "device_id:", "device id:",
     nullptr, nullptr, "2543c433-e716-46bb-a9f4-44481a876b6e"},
    {&header_record::product_id, &Kiv__Header::product_id, 63, "product:", "id:",
     "ro.qeli.version.sw", "ro.build.product_id", "test_id"},
    {&header_record::software_version, &Kiv__Header::software_version, 63, "sw_version:", "revision:",
     "ro.qeli.version.sw_revision", "ro.build.id", "test_rev"},
    {&header_record::software_variant, &Kiv__Header::software_variant, 63, "variant:", "variant:",
     "ro.qeli.version.sw_variant", nullptr, "test_var"},
    {&header_record::build_type, &Kiv__Header::build_type, 63, "build_type:", "type:",
     "ro.qeli.version.sw_type", "ro.build.type", "eng"},
    {&header_record::cdf_id, &Kiv__Header::cdf_id, 63, "cdf_id:", "cdf_id:",
     nullptr, nullptr, "1234-5678_R6D"},
    {&header_record::serial_number, &Kiv__Header::serial_number, 11, "serial_num:", "serial num:",
     nullptr, nullptr, "ABCDEFGHIJ"},
    {&header_record::device_imei, &Kiv__Header::device_imei, 40, "device_imei:", "device imei:",
     nullptr, nullptr, "1234567890"},
};
// clang-format on
static_assert(offsetof(header_record, config_checksum) ==
                  std::size(header_fields) * sizeof(header_text),
              "each text before the checksum has a row");

// The header record in force.
[[nodiscard]] header_record& get_header_record();

// The position of `id`, or max_group_ids when it is not there.
[[nodiscard]] size_t find_group_id(const group_id_list& groups, std::string_view id);

// False when it was there already. A seventh id drops the oldest.
bool add_group_id(group_id_list& groups, std::string_view id);

// Copies what `source` knows; checksum and timezone always, group ids never.
void copy_known_values(header_record& destination, const header_record& source);

// Packs the header record. On failure, logged and raised unless memory was short, there is no
// report header.
void pack_report_header();

// The packed report header; empty when there is none. Valid until the next pack_report_header.
[[nodiscard]] std::span<const uint8_t> get_report_header();

// The packed report header of an empty header record, for sealed reports; empty on failure, which
// has been logged and raised.
[[nodiscard]] std::span<const uint8_t> get_empty_report_header();

// Writes the report header. A failure has been logged and raised.
[[nodiscard]] bool write_report_header(int fd);

// Releases the report header and resets the header record.
void release_header();

}  // namespace kivd
