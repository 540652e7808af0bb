// Opens reports that are encrypted for their collectors: AES-128-CBC with a random key, which is
// encrypted with the collectors' RSA key.
#pragma once

#include <openssl/evp.h>

#include <string>

#include "report.pb.h"

namespace kivd {

// Whether the report's content is encrypted.
[[nodiscard]] bool is_sealed(const kiv::Report& report);

// Decrypts the report into `content`, the gzip file that was sealed. Returns why that is not
// possible as the end of a sentence; empty on success. The content is not authenticated: that it is
// gzip data is the only check.
[[nodiscard]] std::string open_sealed(const kiv::Report& report, EVP_PKEY& private_key,
                                      std::string& content);

}  // namespace kivd
