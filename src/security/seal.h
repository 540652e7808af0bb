// Envelope encryption: data is encrypted with AES-128-CBC (PKCS#7 padding) under a random key and
// IV of its own, and that key with the RSA report key (RSAES-PKCS1-v1_5).
#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <span>

#include "security/crypto_module.h"

namespace kivd {

// One encryption that is under way.
struct sealing {
    crypto_cipher cipher;
    std::array<uint8_t, max_report_key_bits / 8> encrypted_key;  // as long as the key's modulus
    uint32_t key_bits;
    std::array<uint8_t, cipher_block_size> iv;

    [[nodiscard]] std::span<const uint8_t> key() const {
        return std::span(encrypted_key).first(key_bits / 8);
    }
};

// Starts one encryption with the report key. Nothing when there is no RSA key of up to 4096 bits
// and of whole bytes, which has been logged and raised, or when the library failed.
[[nodiscard]] std::optional<sealing> start_sealing();

// The size of the ciphertext of `size` bytes: padding adds 1 to 16.
[[nodiscard]] constexpr uint32_t sealed_size(uint32_t size) { return (size & ~15U) + 16; }

// Encrypts all that `input` still has into `output` and finishes the sealing. True when sealed_size
// bytes have been written; a failure has been logged and raised.
[[nodiscard]] bool encrypt_file(int input, int output, sealing& started);

}  // namespace kivd
