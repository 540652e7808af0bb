// Keys in PEM files, signatures and checksums.
#pragma once

#include <openssl/evp.h>

#include <cstddef>
#include <string>
#include <string_view>

#include "util/unique_openssl.h"

namespace kivd {

enum class key_half { private_half, public_half };

// Reads one key, asking at the terminal for its pass phrase when it has one. Gives what is wrong as
// a sentence that starts with the path, empty when `key` has been read.
[[nodiscard]] std::string read_key(const std::string& path, key_half half, unique_pkey& key);

// The longest signature that the daemon reads, in bytes.
inline constexpr size_t max_signature_size = 1024;

// Signs the SHA-1 digest of `data` (PKCS #1 v1.5 with an RSA key). Gives what is wrong with the
// key as the end of a sentence, empty when `signature` has been made.
[[nodiscard]] std::string sign(EVP_PKEY& private_key, std::string_view data,
                               std::string& signature);

[[nodiscard]] bool signature_holds(EVP_PKEY& public_key, std::string_view data,
                                   std::string_view signature);

// The SHA-1 digest in 40 lowercase hexadecimal digits.
[[nodiscard]] std::string sha1_text(std::string_view data);

}  // namespace kivd
