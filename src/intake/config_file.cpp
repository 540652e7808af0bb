#include "intake/config_file.h"

#include <unistd.h>
#include <zlib.h>

#include <cstdlib>
#include <memory>
#include <utility>

#include "format/config_file.h"
#include "runtime/log_and_raise.h"
#include "util/paths.h"
#include "util/releaser.h"
#include "util/unique_fd.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-conf";
constexpr size_t chunk_size = 16384;

using unique_gz = std::unique_ptr<gzFile_s, releaser<gzclose_r>>;

bool failed_to_extract(const char* path) {
    return log_and_raise(tag, "Failed to extract to %s", path);
}

bool extract_field(std::span<const uint8_t> content, const char* path) {
    const unique_fd file = create_file(path);
    const bool written = file.ok() && write_all(file.get(), content.data(), content.size());
    return written || content.empty() || failed_to_extract(path);
}

// Appends the next chunk to the package. Returns its size, or nothing on failure.
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
    // What an interrupted intake has left would be taken for this file's.
    (void)remove(paths::new_config_signature);
    (void)remove(paths::new_config_data);
    config_fields fields;
    switch (find_config_fields(file, fields)) {
        case config_fault::none:
            break;
        case config_fault::no_package:
            return false;
        case config_fault::bad_length:
            return log_and_raise(tag, "Corrupt file - bad field length");
        case config_fault::cut_signature:
            return failed_to_extract(paths::new_config_signature);
        case config_fault::cut_package:
            return failed_to_extract(paths::new_config_data);
    }
    if (fields.signature && !extract_field(*fields.signature, paths::new_config_signature)) {
        return false;
    }
    return extract_field(fields.package, paths::new_config_data);
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
