#include "toolkit/keys.h"

#include <openssl/err.h>
#include <openssl/pem.h>

#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <new>
#include <stdexcept>

#include "format/config_file.h"
#include "toolkit/text_escape.h"
#include "util/bytes.h"
#include "util/unique_fd.h"

namespace kivd {
namespace {

unique_digest new_digest() {
    unique_digest digest(EVP_MD_CTX_new());
    if (!digest) throw std::bad_alloc();
    return digest;
}

}  // namespace

unique_pkey read_key(const std::string& path, key_half half) {
    const unique_file file(fopen(path.c_str(), "re"));
    if (!file) throw std::runtime_error(printable(path) + ": cannot be opened: " + strerror(errno));
    const bool is_private = half == key_half::private_half;
    const auto read = is_private ? PEM_read_PrivateKey : PEM_read_PUBKEY;
    unique_pkey key(read(file.get(), nullptr, nullptr, nullptr));
    ERR_clear_error();
    if (key) return key;
    throw std::runtime_error(printable(path) + ": holds no " + (is_private ? "private" : "public") +
                             " key in PEM form that can be read");
}

std::string sign(const std::string& key_path, std::string_view data) {
    const unique_pkey key = read_key(key_path, key_half::private_half);
    const unique_digest digest = new_digest();
    size_t size = 0;
    std::string signature;
    bool is_signed =
        EVP_DigestSignInit(digest.get(), nullptr, EVP_sha1(), nullptr, key.get()) == 1 &&
        EVP_DigestSign(digest.get(), nullptr, &size, bytes_of(data).data(), data.size()) == 1;
    if (is_signed) {
        signature.resize(size);
        is_signed = EVP_DigestSign(digest.get(), reinterpret_cast<uint8_t*>(signature.data()),
                                   &size, bytes_of(data).data(), data.size()) == 1;
        signature.resize(size);
    }
    ERR_clear_error();
    if (!is_signed) throw std::runtime_error(printable(key_path) + ": cannot sign SHA-1 digests");
    if (size <= max_signature_size) return signature;
    throw std::runtime_error(printable(key_path) + ": makes signatures of " + std::to_string(size) +
                             " bytes, the daemon reads " + std::to_string(max_signature_size));
}

bool signature_holds(EVP_PKEY& public_key, std::string_view data, std::string_view signature) {
    if (signature.size() > max_signature_size) return false;
    const unique_digest digest = new_digest();
    const bool holds =
        EVP_DigestVerifyInit(digest.get(), nullptr, EVP_sha1(), nullptr, &public_key) == 1 &&
        EVP_DigestVerify(digest.get(), bytes_of(signature).data(), signature.size(),
                         bytes_of(data).data(), data.size()) == 1;
    ERR_clear_error();
    return holds;
}

std::string sha1_text(std::string_view data) {
    config_checksum digest;
    if (EVP_Digest(data.data(), data.size(), digest.data(), nullptr, EVP_sha1(), nullptr) != 1) {
        throw std::bad_alloc();
    }
    return text_of_checksum(digest).data();
}

}  // namespace kivd
