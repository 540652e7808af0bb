// RSA keys as a device and its owner have them, and the operations on them without a daemon.
#pragma once

#include <string>
#include <string_view>

namespace kivd::bench {

// Puts a fresh key pair of 2048 bits into `directory`: private.pem, and its public half under
// `public_name`.
void make_keys(const std::string& directory, const char* public_name);

// A signature as configurations have it: over the SHA-1 digest, by PKCS #1 v1.5.
[[nodiscard]] std::string sign(const std::string& directory, std::string_view data);
[[nodiscard]] bool verify(const std::string& public_path, std::string_view data,
                          std::string_view signature);

}  // namespace kivd::bench
