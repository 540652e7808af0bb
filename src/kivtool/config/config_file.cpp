#include "kivtool/config/config_file.h"

#include <google/protobuf/io/gzip_stream.h>
#include <google/protobuf/io/zero_copy_stream_impl_lite.h>
#include <zlib.h>

#include <cstdint>
#include <cstdio>
#include <stdexcept>

#include "format/config_file.h"
#include "toolkit/unpacked_bytes.h"
#include "util/bytes.h"

namespace kivd {
namespace {

namespace protobuf = google::protobuf;

std::string no_package(bool is_signed, std::string_view rest) {
    const std::string place = is_signed ? "behind the signature" : "at its start";
    if (rest.empty()) return "it ends " + place;
    char text[64];
    snprintf(text, sizeof text, "the byte %s is 0x%02X, a package starts with 0x12", place.c_str(),
             static_cast<uint8_t>(rest[0]));
    return text;
}

// Why the bytes are not a configuration file; empty when they are.
std::string fault_of(std::string_view bytes, config_fields& fields) {
    if (bytes.empty()) return "the file is empty";
    switch (find_config_fields(bytes_of(bytes), fields)) {
        case config_fault::none:
            return "";
        case config_fault::no_package:
            return no_package(fields.signature.has_value(), text_of(fields.rest));
        case config_fault::bad_length:
            return "a field's length does not end or is larger than the file";
        case config_fault::cut_signature:
            return "the signature is cut short";
        case config_fault::cut_package:
            return "the package is cut short";
    }
    return "";
}

}  // namespace

config_file split_config_file(std::string_view bytes) {
    config_fields fields;
    const std::string fault = fault_of(bytes, fields);
    if (!fault.empty()) throw std::runtime_error("is no configuration: " + fault);
    return {fields.signature ? std::optional(text_of(*fields.signature)) : std::nullopt,
            text_of(fields.package), fields.rest.size()};
}

kiv::config::ConfigPackage decompress_package(std::string_view compressed_data,
                                              std::vector<std::string>& notes) {
    unpacked_bytes bytes(compressed_data, "the compressed package");
    std::string packed;
    while (packed.size() <= max_config_package_size && bytes.read_some(packed)) {
    }
    if (packed.size() > max_config_package_size) {
        throw std::runtime_error("the package has more than " +
                                 std::to_string(max_config_package_size) + " bytes");
    }
    if (bytes.has_foreign_tail()) {
        notes.push_back(bytes.problem() + " and are ignored");
    } else if (!bytes.problem().empty()) {
        throw std::runtime_error(bytes.problem());
    }
    kiv::config::ConfigPackage package;
    if (!package.ParseFromString(packed)) {
        throw std::runtime_error("the package cannot be decoded");
    }
    if (!bytes.is_gzip()) notes.emplace_back("the package is not compressed");
    return package;
}

std::string compress_package(const kiv::config::ConfigPackage& package) {
    const size_t size = package.ByteSizeLong();
    if (size > max_config_package_size) {
        throw std::runtime_error("the parts take " + std::to_string(size) +
                                 " bytes, a package has at most " +
                                 std::to_string(max_config_package_size));
    }
    std::string compressed_data;
    protobuf::io::StringOutputStream bytes(&compressed_data);
    protobuf::io::GzipOutputStream::Options options;
    options.compression_level = Z_BEST_COMPRESSION;
    protobuf::io::GzipOutputStream gzip(&bytes, options);
    if (!package.SerializeToZeroCopyStream(&gzip) || !gzip.Close()) {
        throw std::runtime_error("the parts cannot be compressed");
    }
    return compressed_data;
}

// protobuf writes fields in the order of their numbers, so the signature comes first.
std::string join_config_file(const kiv::config::ConfigResponse& file) {
    std::string bytes = file.SerializeAsString();
    if (bytes.size() <= max_config_file_size) return bytes;
    throw std::runtime_error("a configuration has at most " + std::to_string(max_config_file_size) +
                             " bytes, this one has " + std::to_string(bytes.size()));
}

}  // namespace kivd
