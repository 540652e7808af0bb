#include "intake/config_file.h"

#include <unistd.h>
#include <zlib.h>

#include <algorithm>
#include <cstdlib>
#include <memory>
#include <utility>

#include "runtime/log_and_raise.h"
#include "util/paths.h"
#include "util/unique_fd.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-conf";
constexpr uint8_t signature_key = 0x0A;
constexpr uint8_t data_key = 0x12;
constexpr size_t max_varint_size = 5;
constexpr size_t chunk_size = 16384;

using unique_gz = std::unique_ptr<gzFile_s, releaser<gzclose_r>>;

// What is left of the file, and the whole of it.
struct config_bytes {
    std::span<const uint8_t> rest;
    size_t file_size;
};

bool take_key(config_bytes& bytes, uint8_t key) {
    if (bytes.rest.empty() || bytes.rest.front() != key) return false;
    bytes.rest = bytes.rest.subspan(1);
    return true;
}

// A varint of 32 bits; higher ones are lost.
std::optional<uint32_t> take_length(config_bytes& bytes) {
    const size_t limit = std::min(bytes.rest.size(), max_varint_size);
    uint32_t length = 0;
    for (size_t i = 0; i < limit; ++i) {
        length |= (bytes.rest[i] & 0x7FU) << (7 * i);
        if ((bytes.rest[i] & 0x80U) != 0) continue;
        bytes.rest = bytes.rest.subspan(i + 1);
        // As signed numbers, so a length of 2 GiB or more passes here: no file has that many bytes.
        const auto room = static_cast<int32_t>(bytes.file_size - (i + 1));
        if (static_cast<int32_t>(length) > room) break;
        return length;
    }
    log_and_raise(tag, "Corrupt file - bad field length");
    return std::nullopt;
}

bool extract_field(config_bytes& bytes, const char* path) {
    const std::optional<uint32_t> length = take_length(bytes);
    if (!length) return false;
    if (*length <= bytes.rest.size()) {
        const unique_fd file = create_file(path);
        const bool written = file.ok() && write_all(file.get(), bytes.rest.data(), *length);
        bytes.rest = bytes.rest.subspan(*length);
        if (written || *length == 0) return true;
    }
    return log_and_raise(tag, "Failed to extract to %s", path);
}

// Appends the next chunk to the package. Gives its size, or nothing on failure.
std::optional<size_t> read_chunk(gzFile file, file_bytes& package) {
    void* const grown = realloc(package.data.get(), package.size + chunk_size);
    if (grown == nullptr) return std::nullopt;
    (void)package.data.release();
    package.data.reset(static_cast<uint8_t*>(grown));
    const int n = gzread(file, package.data.get() + package.size, chunk_size);
    if (n < 0) return std::nullopt;
    package.size += static_cast<size_t>(n);
    return static_cast<size_t>(n);
}

// gzeof alone is true for a stream that was cut short as well.
bool is_complete(gzFile file) {
    int error = Z_OK;
    (void)gzerror(file, &error);
    return gzeof(file) != 0 && error == Z_OK;
}

}  // namespace

bool extract_config_fields(std::span<const uint8_t> file) {
    // Those of an intake that was cut short would be taken for this file's.
    (void)remove(paths::new_config_signature);
    (void)remove(paths::new_config_data);
    config_bytes bytes = {file, file.size()};
    if (take_key(bytes, signature_key) && !extract_field(bytes, paths::new_config_signature)) {
        return false;
    }
    return take_key(bytes, data_key) && extract_field(bytes, paths::new_config_data);
}

std::optional<file_bytes> read_config_package() {
    unique_gz file(gzopen(paths::new_config_data, "rbe"));
    if (!file) return std::nullopt;
    file_bytes package = {};
    std::optional<size_t> size;
    do {
        size = read_chunk(file.get(), package);
        if (!size || package.size > max_config_package_size) return std::nullopt;
    } while (*size == chunk_size);
    if (!is_complete(file.get()) || gzclose_r(file.release()) != Z_OK) return std::nullopt;
    return package;
}

}  // namespace kivd
