#include "kivtool/report/sealed_report.h"

#include <openssl/err.h>
#include <openssl/rsa.h>

#include <cstddef>
#include <cstdint>
#include <limits>
#include <new>

#include "toolkit/unpacked_bytes.h"
#include "util/bytes.h"
#include "util/unique_openssl.h"

namespace kivd {
namespace {

constexpr size_t aes_key_size = 16;
constexpr size_t iv_size = 16;
constexpr size_t block_size = 16;

// Which of the two it is cannot be told: a wrong key only makes other bytes.
constexpr char not_opened[] = "the report is sealed for another key, or damaged";

uint8_t* start_of(std::string& text) { return reinterpret_cast<uint8_t*>(text.data()); }

bool decrypt_key(EVP_PKEY& private_key, const std::string& encrypted, std::string& aes_key) {
    const unique_pkey_context context(EVP_PKEY_CTX_new(&private_key, nullptr));
    if (!context) throw std::bad_alloc();
    size_t size = 0;
    if (EVP_PKEY_decrypt_init(context.get()) != 1 ||
        EVP_PKEY_CTX_set_rsa_padding(context.get(), RSA_PKCS1_PADDING) != 1 ||
        EVP_PKEY_decrypt(context.get(), nullptr, &size, bytes_of(encrypted).data(),
                         encrypted.size()) != 1) {
        return false;
    }
    aes_key.resize(size);
    const int result = EVP_PKEY_decrypt(context.get(), start_of(aes_key), &size,
                                        bytes_of(encrypted).data(), encrypted.size());
    aes_key.resize(result == 1 ? size : 0);
    return aes_key.size() == aes_key_size;
}

bool decrypt_content(const std::string& aes_key, const std::string& iv,
                     const std::string& encrypted, std::string& content) {
    const unique_cipher cipher(EVP_CIPHER_CTX_new());
    if (!cipher) throw std::bad_alloc();
    content.resize(encrypted.size() + block_size);
    int size = 0;
    int last_size = 0;
    if (EVP_DecryptInit_ex(cipher.get(), EVP_aes_128_cbc(), nullptr, bytes_of(aes_key).data(),
                           bytes_of(iv).data()) != 1 ||
        EVP_DecryptUpdate(cipher.get(), start_of(content), &size, bytes_of(encrypted).data(),
                          static_cast<int>(encrypted.size())) != 1 ||
        EVP_DecryptFinal_ex(cipher.get(), start_of(content) + size, &last_size) != 1) {
        return false;
    }
    content.resize(static_cast<size_t>(size) + static_cast<size_t>(last_size));
    return content.starts_with(gzip_magic);
}

}  // namespace

bool is_sealed(const kiv::Report& report) {
    return report.has_encryption_key() || report.has_encryption_iv() ||
           report.has_encrypted_compressed_data();
}

std::string open_sealed(const kiv::Report& report, EVP_PKEY& private_key, std::string& content) {
    const std::string& encrypted = report.encrypted_compressed_data();
    if (!report.has_encryption_key() || !report.has_encrypted_compressed_data() ||
        report.encryption_iv().size() != iv_size) {
        return "the report is sealed, but what is needed to open it is not all there";
    }
    if (encrypted.size() > size_t{std::numeric_limits<int>::max()} - block_size) {
        return "the report is too large to be opened";
    }
    std::string aes_key;
    const bool is_open = decrypt_key(private_key, report.encryption_key(), aes_key) &&
                         decrypt_content(aes_key, report.encryption_iv(), encrypted, content);
    ERR_clear_error();
    return is_open ? "" : not_opened;
}

}  // namespace kivd
