#include "crypto/crypto.h"

#include <openssl/err.h>
#include <openssl/evp.h>
#include <openssl/pem.h>

namespace kivd {
namespace {

// libcrypto's own types, under the names that the daemon has for them.
EVP_PKEY* own(const public_key* key) {
    return const_cast<EVP_PKEY*>(reinterpret_cast<const EVP_PKEY*>(key));
}
EVP_CIPHER_CTX* own(cipher* started) { return reinterpret_cast<EVP_CIPHER_CTX*>(started); }
EVP_MD_CTX* own(digest* created) { return reinterpret_cast<EVP_MD_CTX*>(created); }

bool succeeded(int result) {
    ERR_clear_error();
    return result == 1;
}

public_key* read_key(FILE* file) {
    // An empty pass phrase replaces the library's own callback, which would ask at the terminal.
    char no_pass_phrase[] = "";
    EVP_PKEY* const key = PEM_read_PUBKEY(file, nullptr, nullptr, no_pass_phrase);
    ERR_clear_error();
    return reinterpret_cast<public_key*>(key);
}

void release_key(public_key* key) { EVP_PKEY_free(own(key)); }

key_facts describe_key(const public_key* key) {
    const char* const type = EVP_PKEY_get0_type_name(own(key));
    return {type != nullptr ? type : "unknown", EVP_PKEY_is_a(own(key), "RSA") == 1,
            EVP_PKEY_get_bits(own(key))};
}

cipher* start_sealing(const public_key* key, uint8_t* encrypted_key,
                      std::array<uint8_t, cipher_block_size>& iv) {
    auto* const started = reinterpret_cast<cipher*>(EVP_CIPHER_CTX_new());
    if (started == nullptr) return nullptr;
    int key_size = 0;
    EVP_PKEY* recipient = own(key);
    if (succeeded(EVP_SealInit(own(started), EVP_aes_128_cbc(), &encrypted_key, &key_size,
                               iv.data(), &recipient, 1))) {
        return started;
    }
    EVP_CIPHER_CTX_free(own(started));
    return nullptr;
}

int seal(cipher* started, std::span<const uint8_t> plain, uint8_t* sealed) {
    int size = 0;
    return succeeded(EVP_EncryptUpdate(own(started), sealed, &size, plain.data(),
                                       static_cast<int>(plain.size())))
               ? size
               : -1;
}

int finish_sealing(cipher* started, uint8_t* sealed) {
    int size = 0;
    return succeeded(EVP_SealFinal(own(started), sealed, &size)) ? size : -1;
}

void release_cipher(cipher* ended) { EVP_CIPHER_CTX_free(own(ended)); }

digest* create_digest() { return reinterpret_cast<digest*>(EVP_MD_CTX_new()); }

bool start_digest(digest* created) {
    return succeeded(EVP_DigestInit_ex(own(created), EVP_sha1(), nullptr));
}

bool add_data(digest* started, std::span<const uint8_t> data) {
    return succeeded(EVP_DigestUpdate(own(started), data.data(), data.size()));
}

bool is_signed(digest* complete, std::span<const uint8_t> signature, const public_key* key) {
    return succeeded(EVP_VerifyFinal(own(complete), signature.data(),
                                     static_cast<unsigned>(signature.size()), own(key)));
}

void release_digest(digest* ended) { EVP_MD_CTX_free(own(ended)); }

bool sha1(std::span<const uint8_t> data, sha1_digest& into) {
    return succeeded(
        EVP_Digest(data.data(), data.size(), into.data(), nullptr, EVP_sha1(), nullptr));
}

}  // namespace

extern "C" [[gnu::visibility("default")]] const crypto_functions kivd_crypto;
const crypto_functions kivd_crypto = {
    .version = KIV_VERSION,
    .read_key = read_key,
    .release_key = release_key,
    .describe_key = describe_key,
    .start_sealing = start_sealing,
    .seal = seal,
    .finish_sealing = finish_sealing,
    .release_cipher = release_cipher,
    .create_digest = create_digest,
    .start_digest = start_digest,
    .add_data = add_data,
    .is_signed = is_signed,
    .release_digest = release_digest,
    .sha1 = sha1,
};

}  // namespace kivd
