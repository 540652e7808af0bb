#include "kivtool/report/sealed_report.h"

#include <openssl/err.h>

#include <cstddef>
#include <cstdint>
#include <limits>
#include <new>
#include <span>

#include "toolkit/unique_openssl.h"
#include "toolkit/unpacked_bytes.h"
#include "util/bytes.h"

namespace kivd {
namespace {

constexpr size_t iv_size = 16;
constexpr size_t block_size = 16;

// The two cannot be told apart: a wrong key only gives other bytes.
constexpr char not_opened[] = "the report is sealed for another key, or damaged";

uint8_t* start_of(std::string& text) { return reinterpret_cast<uint8_t*>(text.data()); }

bool decrypt(const kiv::Report& report, EVP_PKEY& private_key, std::string& content) {
    const std::span encrypted = bytes_of(report.encrypted_compressed_data());
    const std::span key = bytes_of(report.encryption_key());
    const unique_cipher cipher(EVP_CIPHER_CTX_new());
    if (!cipher) throw std::bad_alloc();
    content.resize(encrypted.size() + block_size);
    int size = 0;
    int last_size = 0;
    if (EVP_OpenInit(cipher.get(), EVP_aes_128_cbc(), key.data(), static_cast<int>(key.size()),
                     bytes_of(report.encryption_iv()).data(), &private_key) <= 0 ||
        EVP_OpenUpdate(cipher.get(), start_of(content), &size, encrypted.data(),
                       static_cast<int>(encrypted.size())) != 1 ||
        EVP_OpenFinal(cipher.get(), start_of(content) + size, &last_size) != 1) {
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
    if (!report.has_encryption_key() || !report.has_encrypted_compressed_data() ||
        report.encryption_iv().size() != iv_size) {
        return "the report is sealed, but what is needed to open it is not all there";
    }
    if (report.encrypted_compressed_data().size() >
        size_t{std::numeric_limits<int>::max()} - block_size) {
        return "the report is too large to be opened";
    }
    const bool is_open = decrypt(report, private_key, content);
    ERR_clear_error();
    return is_open ? "" : not_opened;
}

}  // namespace kivd
