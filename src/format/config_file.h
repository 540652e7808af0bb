// The configuration file: a message of protocol buffers with a signature, which may be left out,
// and the compressed package, in this order.
//
//   0A length signature   12 length package
//
// Lengths are varints of 32 bits; what stands behind the package is ignored.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string_view>

namespace kivd {

inline constexpr size_t max_config_file_size = 204799;  // bytes
// Decompressed, in bytes: the largest file might hold hundreds of MiB.
inline constexpr size_t max_config_package_size = 8U << 20U;

inline constexpr uint8_t config_signature_key = 0x0A;
inline constexpr uint8_t config_package_key = 0x12;

struct config_fields {
    std::optional<std::span<const uint8_t>> signature;
    std::span<const uint8_t> package;
    std::span<const uint8_t> rest;  // behind the last field that is whole
};

// What keeps bytes from being a configuration file.
enum class config_fault : uint8_t {
    none,
    no_package,     // the byte at the start of `rest`, if there is one, is another's key
    bad_length,     // the field's length does not end, or no file can have so many bytes
    cut_signature,  // fewer bytes follow than the field's length says
    cut_package,
};

// Finds the fields, as far as they are whole; they stay where they are.
[[nodiscard]] config_fault find_config_fields(std::span<const uint8_t> file, config_fields& fields);

// SHA-1 over the whole configuration file; all zero stands for none.
using config_checksum = std::array<uint8_t, 20>;

// The same as 40 lowercase hexadecimal digits and a NUL, and back. There any other character counts
// as a 0; a text of another length gives nothing.
using checksum_text = std::array<char, 41>;
[[nodiscard]] checksum_text text_of_checksum(const config_checksum& checksum);
[[nodiscard]] std::optional<config_checksum> parse_checksum(std::string_view digits);

}  // namespace kivd
