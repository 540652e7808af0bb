// Reports that are encrypted for their collectors: AES-128-CBC under a key of their own, which is
// encrypted with the collectors' RSA key.
#pragma once

#include <openssl/evp.h>

#include <string>

#include "report.pb.h"

namespace kivd {

// Whether the report's content is encrypted.
[[nodiscard]] bool is_sealed(const kiv::Report& report);

// Decrypts what the report holds into `content`, the gzip file that it was before. Gives why that
// cannot be done as the end of a sentence, empty when it is done. There is no proof that nobody
// changed the content, but that it is gzip data.
[[nodiscard]] std::string open_sealed(const kiv::Report& report, EVP_PKEY& private_key,
                                      std::string& content);

}  // namespace kivd
