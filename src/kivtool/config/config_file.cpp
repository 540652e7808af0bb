#include "kivtool/config/config_file.h"

#include <google/protobuf/io/gzip_stream.h>
#include <google/protobuf/io/zero_copy_stream_impl_lite.h>
#include <zlib.h>

#include <cstdint>
#include <cstdio>

#include "toolkit/length_varint.h"
#include "toolkit/unpacked_bytes.h"

namespace kivd {
namespace {

namespace protobuf = google::protobuf;

constexpr char signature_key = 0x0a;
constexpr char compressed_data_key = 0x12;

// Takes the field whose key has been taken off the start of `bytes`.
std::string take_field(const std::string& what, std::string_view& bytes,
                       std::string_view& content) {
    const length_varint length = read_length(bytes);
    if (length.size == 0) return "the length of the " + what + " does not end";
    bytes.remove_prefix(length.size);
    if (length.value > bytes.size()) {
        return "the " + what + " should have " + std::to_string(length.value) + " bytes, but " +
               std::to_string(bytes.size()) + " follow";
    }
    content = bytes.substr(0, static_cast<size_t>(length.value));
    bytes.remove_prefix(content.size());
    return "";
}

bool take_key(char key, std::string_view& bytes) {
    if (!bytes.starts_with(key)) return false;
    bytes.remove_prefix(1);
    return true;
}

std::string no_package(bool is_signed, std::string_view rest) {
    const std::string place = is_signed ? "behind the signature" : "at its start";
    if (rest.empty()) return "it ends " + place;
    char text[64];
    snprintf(text, sizeof text, "the byte %s is 0x%02X, a package starts with 0x12", place.c_str(),
             static_cast<uint8_t>(rest[0]));
    return text;
}

}  // namespace

std::string split_config_file(std::string_view bytes, config_file& file) {
    if (bytes.empty()) return "the file is empty";
    if (bytes.size() > max_config_file_size) {
        return "a configuration has at most " + std::to_string(max_config_file_size) +
               " bytes, this one has " + std::to_string(bytes.size());
    }
    if (take_key(signature_key, bytes)) {
        std::string problem = take_field("signature", bytes, file.signature.emplace());
        if (!problem.empty()) return problem;
    }
    if (!take_key(compressed_data_key, bytes)) {
        return no_package(file.signature.has_value(), bytes);
    }
    std::string problem = take_field("package", bytes, file.compressed_data);
    file.ignored_size = bytes.size();
    return problem;
}

std::string compress_package(const kiv::config::ConfigPackage& package,
                             std::string& compressed_data) {
    const size_t size = package.ByteSizeLong();
    if (size > max_package_size) {
        return "the parts take " + std::to_string(size) + " bytes, a package has at most " +
               std::to_string(max_package_size);
    }
    protobuf::io::StringOutputStream bytes(&compressed_data);
    protobuf::io::GzipOutputStream::Options options;
    options.compression_level = Z_BEST_COMPRESSION;
    protobuf::io::GzipOutputStream gzip(&bytes, options);
    const bool is_done = package.SerializeToZeroCopyStream(&gzip) && gzip.Close();
    return is_done ? "" : "the parts cannot be compressed";
}

std::string decompress_package(std::string_view compressed_data,
                               kiv::config::ConfigPackage& package,
                               std::vector<std::string>& notes) {
    unpacked_bytes bytes(compressed_data, "the compressed package");
    std::string packed;
    while (packed.size() <= max_package_size && bytes.read_some(packed)) {
    }
    if (packed.size() > max_package_size) {
        return "the package has more than " + std::to_string(max_package_size) + " bytes";
    }
    if (bytes.has_foreign_tail()) {
        notes.push_back(bytes.problem() + " and are ignored");
    } else if (!bytes.problem().empty()) {
        return bytes.problem();
    }
    if (!package.ParseFromString(packed)) return "the package cannot be decoded";
    if (!bytes.is_gzip()) notes.emplace_back("the package is not compressed");
    return "";
}

}  // namespace kivd
