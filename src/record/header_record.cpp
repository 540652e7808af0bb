#include "record/header_record.h"

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "runtime/log_and_raise.h"
#include "util/file_io.h"
#include "util/releaser.h"
#include "util/text_scan.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-util";

constinit header_record record = {};

struct packed_header {
    uint8_t* bytes;  // a block of malloc, or null
    size_t size;
};
constinit packed_header report_header = {};

void release(packed_header& header) {
    free(header.bytes);
    header = {};
}

// The message asks for texts that can be written to; packing only reads them.
char* packed(const char* text) { return const_cast<char*>(text); }

Kiv__Header message_of(const header_record& header, std::span<char*, max_group_ids> group_ids) {
    Kiv__Header message = KIV__HEADER__INIT;
    for (const header_field& field : header_fields) {
        message.*field.packed = packed(field.get(header));
    }
    message.has_family = true;
    message.family = KIV__FAMILY__ANDROID;
    message.config_checksum = packed(header.config_checksum.get());
    message.report_uuid = packed("");  // there, but no report has one
    message.has_timezone = true;
    message.timezone = header.timezone;
    for (size_t i = 0; i < header.groups.count; ++i) {
        group_ids[i] = packed(header.groups.ids[i].get());
    }
    message.n_group_id = header.groups.count;
    message.group_id = group_ids.data();
    return message;
}

}  // namespace

void header_field::set(header_record& header, std::string_view value) const {
    (header.*text).set(value.substr(0, capacity));
}

void header_field::set_from_line(header_record& header, const char* line) const {
    const std::string_view word = scan_word(line, capacity);
    if (!word.empty()) set(header, word);
}

const char* header_field::get(const header_record& header) const { return (header.*text).get(); }

bool header_field::is_known(const header_record& header) const {
    static constexpr header_record initial;
    return !(header.*text == initial.*text);
}

header_record& get_header_record() { return record; }

size_t find_group_id(const group_id_list& groups, std::string_view id) {
    const std::string_view wanted = id.substr(0, group_id_compared);
    for (size_t i = 0; i < groups.count; ++i) {
        if (std::string_view(groups.ids[i].get()).substr(0, group_id_compared) == wanted) return i;
    }
    return max_group_ids;
}

bool add_group_id(group_id_list& groups, std::string_view id) {
    if (find_group_id(groups, id) != max_group_ids) return false;
    if (groups.count == max_group_ids) {
        std::shift_left(groups.ids.begin(), groups.ids.end(), 1);
        --groups.count;
    }
    groups.ids[groups.count++].set(id);
    return true;
}

void copy_known_values(header_record& destination, const header_record& source) {
    for (const header_field& field : header_fields) {
        if (field.is_known(source)) destination.*field.text = source.*field.text;
    }
    destination.config_checksum = source.config_checksum;
    destination.timezone = source.timezone;
}

void pack_report_header() {
    release(report_header);
    std::array<char*, max_group_ids> group_ids = {};
    Kiv__Header header = message_of(record, group_ids);
    Kiv__Report report = KIV__REPORT__INIT;
    report.header = &header;

    const size_t size = kiv__report__get_packed_size(&report);
    if (size == 0) {
        log_and_raise(tag, "Failed to get packed size of report header.");
        return;
    }
    unique_malloc<uint8_t> bytes(static_cast<uint8_t*>(malloc(size)));
    if (!bytes) return;
    if (kiv__report__pack(&report, bytes.get()) != size) {
        log_and_raise(tag, "Failed to pack report header.");
        return;
    }
    report_header = {bytes.release(), size};
}

std::span<const uint8_t> get_report_header() { return {report_header.bytes, report_header.size}; }

std::span<const uint8_t> get_empty_report_header() {
    static constinit std::array<uint8_t, 16> bytes = {};
    static constinit size_t packed_size = 0;
    if (packed_size > 0) return {bytes.data(), packed_size};

    Kiv__Header header = KIV__HEADER__INIT;
    header.product_id = header.software_version = packed("");
    header.software_variant = header.device_id = packed("");
    Kiv__Report report = KIV__REPORT__INIT;
    report.header = &header;
    const size_t size = kiv__report__get_packed_size(&report);
    if (size == 0 || size > bytes.size()) {
        log_and_raise(tag, "Failed to get packed size of empty report header.");
        return {};
    }
    if (kiv__report__pack(&report, bytes.data()) != size) {
        log_and_raise(tag, "Failed to pack empty report header.");
        return {};
    }
    packed_size = size;
    return {bytes.data(), packed_size};
}

bool write_report_header(int fd) {
    if (write_all(fd, report_header.bytes, report_header.size)) return true;
    return log_and_raise(tag, "Failed to write report header: %s", strerror(errno));
}

void release_header() {
    release(report_header);
    record = {};
}

}  // namespace kivd
