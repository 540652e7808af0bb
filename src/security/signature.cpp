#include "security/signature.h"

#include <openssl/err.h>
#include <openssl/evp.h>

#include <array>
#include <cstdio>

#include "runtime/log_and_raise.h"
#include "security/key_paths.h"
#include "util/file_io.h"
#include "util/unique_fd.h"
#include "util/unique_openssl.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd/crypto";
constexpr size_t max_signature_size = 1024;
constexpr size_t chunk_size = 4096;

bool digest_file(EVP_MD_CTX* digest, FILE* data) {
    std::array<uint8_t, chunk_size> chunk;
    while (const size_t size = fread(chunk.data(), 1, chunk.size(), data)) {
        if (EVP_DigestUpdate(digest, chunk.data(), size) != 1) return false;
    }
    return ferror(data) == 0;
}

bool verify_signature(FILE* data, FILE* signature, EVP_PKEY* key) {
    const unique_digest digest(EVP_MD_CTX_new());
    if (!digest) {
        return log_and_raise(tag, "Failed to create EVP context");
    }
    if (EVP_DigestInit_ex(digest.get(), EVP_sha1(), nullptr) != 1) {
        return log_and_raise(tag, "Failed to initialize EVP");
    }
    if (!digest_file(digest.get(), data)) return false;
    std::array<uint8_t, max_signature_size> bytes;
    const size_t size = fread(bytes.data(), 1, bytes.size(), signature);
    return EVP_VerifyFinal(digest.get(), bytes.data(), static_cast<unsigned>(size), key) == 1;
}

}  // namespace

bool verify_file(const char* data_path, const char* signature_path) {
    const unique_file data = open_to_read(data_path);
    if (!data) {
        return log_and_raise(tag, "Failed to verify file - file can't be opened.");
    }
    const unique_file signature = open_to_read(signature_path);
    if (!signature) {
        return log_and_raise(tag, "Failed to open signature file.");
    }
    const unique_pkey key = load_config_key();
    if (!key) {
        return log_and_raise(tag, "Failed to load public key.");
    }
    const bool holds = verify_signature(data.get(), signature.get(), key.get());
    ERR_clear_error();
    return holds;
}

}  // namespace kivd
