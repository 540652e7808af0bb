// Owners of what OpenSSL hands out.
#pragma once

#include <openssl/evp.h>

#include <memory>

#include "util/releaser.h"

namespace kivd {

using unique_pkey = std::unique_ptr<EVP_PKEY, releaser<EVP_PKEY_free>>;
using unique_pkey_context = std::unique_ptr<EVP_PKEY_CTX, releaser<EVP_PKEY_CTX_free>>;
using unique_digest = std::unique_ptr<EVP_MD_CTX, releaser<EVP_MD_CTX_free>>;
using unique_cipher = std::unique_ptr<EVP_CIPHER_CTX, releaser<EVP_CIPHER_CTX_free>>;

}  // namespace kivd
