// The report header: who the device is, as every report begins with it. The header record holds the
// values in force; packed, it is a kiv.Report with only its field `header`.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <span>
#include <string_view>

namespace kivd {

// A text of at most `limit` characters; longer ones are cut.
template <size_t limit>
class limited_text {
 public:
    static constexpr size_t capacity = limit;

    void set(std::string_view text) {
        const size_t size = text.copy(text_.data(), limit);
        text_[size] = '\0';
    }
    [[nodiscard]] const char* get() const { return text_.data(); }
    [[nodiscard]] char* data() { return text_.data(); }
    [[nodiscard]] bool empty() const { return text_[0] == '\0'; }
    [[nodiscard]] bool is_known() const { return !(*this == "unknown"); }

    bool operator==(const limited_text& other) const { return strcmp(get(), other.get()) == 0; }
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

// "unknown" stands for a value that is not known, except that the IMEI and checksum are then empty.
// Nothing in it is allocated, so filling it cannot fail.
struct header_record {
    limited_text<63> product_id;
    limited_text<63> software_version;
    limited_text<63> software_variant;
    limited_text<40> device_id;
    limited_text<63> build_type;
    limited_text<63> config_checksum;  // 40 hexadecimal digits
    limited_text<63> report_uuid;      // always empty
    int32_t timezone = -1;             // seconds east of UTC
    limited_text<63> cdf_id;
    limited_text<11> serial_number;
    limited_text<40> device_imei;
    group_id_list groups;
};

// Gives a header its initial values.
void init_header(header_record& header);

// The header record of the process.
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
