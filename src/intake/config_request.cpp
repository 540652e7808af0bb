#include "intake/config_request.h"

#include <array>
#include <cerrno>
#include <cstring>
#include <span>

#include "format/record_format.h"
#include "record/header_record.h"
#include "report/state_file.h"
#include "runtime/log_and_raise.h"
#include "util/file_io.h"
#include "util/file_replacement.h"
#include "util/paths.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-conf";

void tell_no_file() {
    log_and_raise(tag, "Failed to open configuration request %s <%s>", paths::config_request,
                  strerror(errno));
}

bool write_content(int fd) {
    const std::span<const uint8_t> header = get_report_header();
    if (!write_all(fd, header.data(), header.size())) {
        return log_and_raise(tag, "Config request write header error: %s", strerror(errno));
    }
    const config_checksum checksum = get_config_checksum();
    std::array<uint8_t, 40> field;
    const size_t size = pack_checksum_field(field, checksum.data(), checksum.size());
    if (write_all(fd, field.data(), size)) return true;
    return log_and_raise(tag, "Config request write checksum error: %s", strerror(errno));
}

}  // namespace

void write_config_request() {
    file_replacement file(paths::config_request, paths::new_config_request);
    if (!file.ok()) return tell_no_file();
    if (!write_content(file.fd())) return;
    if (!file.close() || !file.put_into_place()) tell_no_file();
}

}  // namespace kivd
