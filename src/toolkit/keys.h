// Keys in PEM files, signatures and checksums. What fails is thrown as one sentence.
#pragma once

#include <openssl/evp.h>

#include <cstddef>
#include <string>
#include <string_view>

#include "toolkit/unique_openssl.h"

namespace kivd {

enum class key_half { private_half, public_half };

// Reads one key, asking at the terminal for its pass phrase when it has one.
[[nodiscard]] unique_pkey read_key(const std::string& path, key_half half);

// The longest signature that the daemon reads, in bytes.
inline constexpr size_t max_signature_size = 1024;

// The signature over the SHA-1 digest of `data` (PKCS #1 v1.5 with an RSA key), by the private key
// at `key_path`.
[[nodiscard]] std::string sign(const std::string& key_path, std::string_view data);

[[nodiscard]] bool signature_holds(EVP_PKEY& public_key, std::string_view data,
                                   std::string_view signature);

// The SHA-1 digest in 40 lowercase hexadecimal digits.
[[nodiscard]] std::string sha1_text(std::string_view data);

}  // namespace kivd
