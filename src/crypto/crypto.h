// What the daemon needs of libcrypto. It is a module of its own (kivd-crypto.so), which
// security/crypto_module loads when it is first needed: libcrypto is larger than all the rest of
// the daemon, which without keys never needs it.
//
// The functions neither log nor keep anything. They leave no error behind in libcrypto's queue.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <span>

namespace kivd {

inline constexpr uint32_t max_report_key_bits = 4096;
inline constexpr size_t cipher_block_size = 16;

using sha1_digest = std::array<uint8_t, 20>;

// What only the module looks into.
struct public_key;
struct cipher;
struct digest;

struct key_facts {
    const char* type;  // such as "RSA"; as long as the key is there
    bool is_rsa;
    int bits;
};

struct crypto_functions {
    const char* version;  // of the daemon that the module belongs to

    // The public key in PEM that the file holds, or null.
    public_key* (*read_key)(FILE* file);
    void (*release_key)(public_key* key);
    key_facts (*describe_key)(const public_key* key);

    // Starts AES-128-CBC (PKCS#7 padding) under a random key and IV, and encrypts that key with an
    // RSA key (RSAES-PKCS1-v1_5), into as many bytes as its modulus has. Null on failure.
    cipher* (*start_sealing)(const public_key* key, uint8_t* encrypted_key,
                             std::array<uint8_t, cipher_block_size>& iv);
    // Give the size of what they put into `sealed`, which has room for a block more than what goes
    // in; -1 on failure.
    int (*seal)(cipher* started, std::span<const uint8_t> plain, uint8_t* sealed);
    int (*finish_sealing)(cipher* started, uint8_t* sealed);
    void (*release_cipher)(cipher* ended);

    // SHA-1. A digest is created, started, given the data, and held against a signature.
    digest* (*create_digest)();
    bool (*start_digest)(digest* created);
    bool (*add_data)(digest* started, std::span<const uint8_t> data);
    bool (*is_signed)(digest* complete, std::span<const uint8_t> signature, const public_key* key);
    void (*release_digest)(digest* ended);

    // Of bytes in memory.
    bool (*sha1)(std::span<const uint8_t> data, sha1_digest& into);
};

// The name under which the module has them.
inline constexpr char crypto_symbol[] = "kivd_crypto";

}  // namespace kivd
