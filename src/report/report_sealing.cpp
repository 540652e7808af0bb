#include "report/report_sealing.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <optional>
#include <span>

#include "format/record_format.h"
#include "record/header_record.h"
#include "runtime/log_and_raise.h"
#include "security/seal.h"
#include "util/file_io.h"
#include "util/paths.h"
#include "util/unique_fd.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-compactor";
constexpr size_t crypto_fields_size = max_report_key_bits / 8 + 64;

// All that stands before the ciphertext.
bool write_envelope(int output, const sealing& started, uint32_t plain_size) {
    const std::span<const uint8_t> header = get_empty_report_header();
    if (header.empty()) return log_and_raise(tag, "Failed to get empty report header.");
    std::array<uint8_t, crypto_fields_size> fields;
    const size_t size = pack_crypto_fields(fields, started.encrypted_key.data(), started.key_bits,
                                           started.iv, sealed_size(plain_size));
    iovec pieces[] = {{const_cast<uint8_t*>(header.data()), header.size()}, {fields.data(), size}};
    if (write_all(output, pieces)) return true;
    return log_and_raise(tag, "Failed to write crypto data, %s", strerror(errno));
}

bool write_sealed_data(sealing& started) {
    const unique_fd input(open(paths::compacted_data, O_RDONLY | O_CLOEXEC));
    struct stat status = {};
    if (!input.ok() || fstat(input.get(), &status) != 0) {
        return log_and_raise(tag, "Failed to open input encryption file: %s", strerror(errno));
    }
    const unique_fd output = create_file(paths::encrypted_data);
    if (!output.ok()) {
        return log_and_raise(tag, "Failed to open output encryption file: %s", strerror(errno));
    }
    const auto plain_size = static_cast<uint32_t>(status.st_size);
    return write_envelope(output.get(), started, plain_size) &&
           encrypt_file(input.get(), output.get(), started);
}

}  // namespace

bool seal_compacted_data() {
    std::optional<sealing> started = start_sealing();
    if (!started) return log_and_raise(tag, "Failed to initialize encryption.");
    if (!write_sealed_data(*started)) return false;
    if (rename(paths::encrypted_data, paths::compacted_data) == 0) return true;
    log_and_raise(tag, "Failed to rename encrypted file: %s", strerror(errno));
    (void)unlink(paths::encrypted_data);
    return false;
}

}  // namespace kivd
