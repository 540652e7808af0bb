#include "security/signature.h"

#include <array>
#include <cstdio>
#include <span>

#include "runtime/log_and_raise.h"
#include "security/crypto_module.h"
#include "security/key_paths.h"
#include "util/file_io.h"
#include "util/unique_fd.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd/crypto";
constexpr size_t max_signature_size = 1024;
constexpr size_t chunk_size = 4096;

bool digest_file(digest* started, FILE* data) {
    std::array<uint8_t, chunk_size> chunk;
    while (const size_t size = fread(chunk.data(), 1, chunk.size(), data)) {
        if (!get_crypto()->add_data(started, std::span(chunk).first(size))) return false;
    }
    return ferror(data) == 0;
}

bool verify_signature(FILE* data, FILE* signature, const public_key* key) {
    const crypto_functions& crypto = *get_crypto();
    const crypto_digest digest(crypto.create_digest());
    if (!digest) return log_and_raise(tag, "Failed to create EVP context");
    if (!crypto.start_digest(digest.get())) {
        return log_and_raise(tag, "Failed to initialize EVP");
    }
    if (!digest_file(digest.get(), data)) return false;
    std::array<uint8_t, max_signature_size> bytes;
    const size_t size = fread(bytes.data(), 1, bytes.size(), signature);
    return crypto.is_signed(digest.get(), std::span(bytes).first(size), key);
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
    const crypto_key key = load_config_key();
    if (!key) {
        return log_and_raise(tag, "Failed to load public key.");
    }
    return verify_signature(data.get(), signature.get(), key.get());
}

}  // namespace kivd
