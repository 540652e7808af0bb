// Detached signatures with SHA-1, checked with the configuration key; with an RSA key that is
// RSASSA-PKCS1-v1_5.
#pragma once

namespace kivd {

// Whether the file at `signature_path` is the configuration key's signature over the file at
// `data_path`. Why it could not be checked has been logged and raised; that it does not hold has
// not.
[[nodiscard]] bool verify_file(const char* data_path, const char* signature_path);

}  // namespace kivd
