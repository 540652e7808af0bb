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
#include "util/paths.h"
#include "util/unique_fd.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-conf";

}  // namespace

void write_config_request() {
    const unique_fd file = create_file(paths::config_request);
    if (!file.ok()) {
        log_and_raise(tag, "Failed to open configuration request %s <%s>", paths::config_request,
                      strerror(errno));
        return;
    }
    const std::span<const uint8_t> header = get_report_header();
    if (!write_all(file.get(), header.data(), header.size())) {
        log_and_raise(tag, "Config request write header error: %s", strerror(errno));
    }
    const config_checksum checksum = get_config_checksum();
    std::array<uint8_t, 40> field;
    const size_t size = pack_checksum_field(field, checksum.data(), checksum.size());
    if (!write_all(file.get(), field.data(), size)) {
        log_and_raise(tag, "Config request write checksum error: %s", strerror(errno));
    }
}

}  // namespace kivd
