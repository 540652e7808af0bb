#include "format/config_file.h"

#include "format/varint.h"

namespace kivd {
namespace {

using bytes = std::span<const uint8_t>;

constexpr char hex_digits[] = "0123456789abcdef";

uint8_t value_of_hex_digit(char digit) {
    if (digit >= '0' && digit <= '9') return static_cast<uint8_t>(digit - '0');
    if (digit >= 'a' && digit <= 'f') return static_cast<uint8_t>(digit - 'a' + 10);
    return 0;
}

bool take_key(bytes& rest, uint8_t key) {
    if (rest.empty() || rest.front() != key) return false;
    rest = rest.subspan(1);
    return true;
}

// Takes a field whose key has been taken; `cut` is the fault of one that is not whole.
config_fault take_content(bytes file, bytes& rest, config_fault cut, bytes& content) {
    bytes behind = rest;
    const std::optional<uint64_t> number = take_varint(behind, max_varint32_size);
    if (!number) return config_fault::bad_length;
    const auto length = static_cast<uint32_t>(*number);
    // As signed numbers, so a length of 2 GiB or more passes here: no file has that many bytes.
    const size_t length_size = rest.size() - behind.size();
    const auto room = static_cast<int32_t>(file.size() - length_size);
    if (static_cast<int32_t>(length) > room) return config_fault::bad_length;
    if (length > behind.size()) return cut;
    content = behind.first(length);
    rest = behind.subspan(length);
    return config_fault::none;
}

}  // namespace

config_fault find_config_fields(bytes file, config_fields& fields) {
    fields = {std::nullopt, {}, file};
    if (take_key(fields.rest, config_signature_key)) {
        const config_fault fault = take_content(file, fields.rest, config_fault::cut_signature,
                                                fields.signature.emplace());
        if (fault != config_fault::none) return fault;
    }
    if (!take_key(fields.rest, config_package_key)) return config_fault::no_package;
    return take_content(file, fields.rest, config_fault::cut_package, fields.package);
}

checksum_text text_of_checksum(const config_checksum& checksum) {
    checksum_text text = {};
    char* out = text.data();
    for (const uint8_t byte : checksum) {
        *out++ = hex_digits[byte >> 4U];
        *out++ = hex_digits[byte & 0xFU];
    }
    return text;
}

std::optional<config_checksum> parse_checksum(std::string_view digits) {
    config_checksum checksum;
    if (digits.size() != 2 * checksum.size()) return std::nullopt;
    for (size_t i = 0; i < checksum.size(); ++i) {
        checksum[i] = static_cast<uint8_t>(value_of_hex_digit(digits[2 * i]) << 4U |
                                           value_of_hex_digit(digits[2 * i + 1]));
    }
    return checksum;
}

}  // namespace kivd
