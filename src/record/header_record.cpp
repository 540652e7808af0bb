#include "record/header_record.h"

#include <algorithm>
#include <cerrno>
#include <cstdlib>

#include "report.pb-c.h"
#include "runtime/log_and_raise.h"
#include "util/file_io.h"
#include "util/unique_fd.h"

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

// The texts that a header always carries, with the places in the message that they go to.
Kiv__Header message_of(header_record& header, std::span<char*, max_group_ids> group_ids) {
    Kiv__Header message = KIV__HEADER__INIT;
    message.product_id = header.product_id.data();
    message.software_version = header.software_version.data();
    message.software_variant = header.software_variant.data();
    message.device_id = header.device_id.data();
    message.build_type = header.build_type.data();
    message.has_family = true;
    message.family = KIV__FAMILY__ANDROID;
    message.config_checksum = header.config_checksum.data();
    message.report_uuid = header.report_uuid.data();
    message.has_timezone = true;
    message.timezone = header.timezone;
    message.cdf_id = header.cdf_id.data();
    message.serial_number = header.serial_number.data();
    message.device_imei = header.device_imei.data();
    for (size_t i = 0; i < header.groups.count; ++i) group_ids[i] = header.groups.ids[i].data();
    message.n_group_id = header.groups.count;
    message.group_id = group_ids.data();
    return message;
}

}  // namespace

void init_header(header_record& header) {
    header = {};
    header.product_id.set("unknown");
    header.software_version.set("unknown");
    header.software_variant.set("unknown");
    header.device_id.set("unknown");
    header.build_type.set("unknown");
    header.cdf_id.set("unknown");
    header.serial_number.set("unknown");
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
    const auto copy_known = [](auto& to, const auto& from) {
        if (from.is_known()) to = from;
    };
    copy_known(destination.product_id, source.product_id);
    copy_known(destination.software_version, source.software_version);
    copy_known(destination.software_variant, source.software_variant);
    copy_known(destination.build_type, source.build_type);
    copy_known(destination.cdf_id, source.cdf_id);
    copy_known(destination.device_id, source.device_id);
    copy_known(destination.serial_number, source.serial_number);
    if (!source.device_imei.empty()) destination.device_imei = source.device_imei;
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

    char empty[] = "";
    Kiv__Header header = KIV__HEADER__INIT;
    header.product_id = header.software_version = empty;
    header.software_variant = header.device_id = empty;
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
