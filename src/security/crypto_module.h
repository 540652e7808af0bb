// The module crypto/crypto.h, loaded when it is first asked for.
#pragma once

#include <memory>

#include "crypto/crypto.h"

namespace kivd {

// Null when the module cannot be loaded, which has been logged and raised: what needs it fails.
[[nodiscard]] const crypto_functions* get_crypto();

// Hands what the module gave out back to it.
template <auto release>
struct crypto_releaser {
    void operator()(auto* object) const noexcept { (get_crypto()->*release)(object); }
};
using crypto_key = std::unique_ptr<public_key, crypto_releaser<&crypto_functions::release_key>>;
using crypto_cipher = std::unique_ptr<cipher, crypto_releaser<&crypto_functions::release_cipher>>;
using crypto_digest = std::unique_ptr<digest, crypto_releaser<&crypto_functions::release_digest>>;

}  // namespace kivd
