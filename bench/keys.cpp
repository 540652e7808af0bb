#include "bench/keys.h"

#include <openssl/evp.h>
#include <openssl/pem.h>
#include <openssl/rsa.h>

#include <cstdio>
#include <memory>

#include "bench/measure.h"
#include "util/unique_fd.h"

namespace kivd::bench {

namespace {

constexpr unsigned key_bits = 2048;

using unique_key = std::unique_ptr<EVP_PKEY, releaser<EVP_PKEY_free>>;
using unique_digest = std::unique_ptr<EVP_MD_CTX, releaser<EVP_MD_CTX_free>>;

unique_file open_stream(const std::string& path, const char* mode) {
    unique_file file(fopen(path.c_str(), mode));
    if (!file) give_up("%s: cannot be opened", path.c_str());
    return file;
}

const uint8_t* bytes_of(std::string_view text) {
    return reinterpret_cast<const uint8_t*>(text.data());
}

}  // namespace

void make_keys(const std::string& directory, const char* public_name) {
    const unique_key key(EVP_RSA_gen(key_bits));
    const unique_file secret = open_stream(directory + "/private.pem", "we");
    const unique_file open = open_stream(directory + "/" + public_name, "we");
    if (!key ||
        PEM_write_PrivateKey(secret.get(), key.get(), nullptr, nullptr, 0, nullptr, nullptr) != 1 ||
        PEM_write_PUBKEY(open.get(), key.get()) != 1)
        give_up("no key pair could be made");
}

std::string sign(const std::string& directory, std::string_view data) {
    const unique_file file = open_stream(directory + "/private.pem", "re");
    const unique_key key(PEM_read_PrivateKey(file.get(), nullptr, nullptr, nullptr));
    const unique_digest digest(EVP_MD_CTX_new());
    std::string signature(key_bits / 8, '\0');
    size_t size = signature.size();
    if (EVP_DigestSignInit(digest.get(), nullptr, EVP_sha1(), nullptr, key.get()) != 1 ||
        EVP_DigestSign(digest.get(), reinterpret_cast<uint8_t*>(signature.data()), &size,
                       bytes_of(data), data.size()) != 1)
        give_up("no signature could be made");
    return signature;
}

bool verify(const std::string& public_path, std::string_view data, std::string_view signature) {
    const unique_file file = open_stream(public_path, "re");
    const unique_key key(PEM_read_PUBKEY(file.get(), nullptr, nullptr, nullptr));
    const unique_digest digest(EVP_MD_CTX_new());
    return EVP_DigestVerifyInit(digest.get(), nullptr, EVP_sha1(), nullptr, key.get()) == 1 &&
           EVP_DigestVerify(digest.get(), bytes_of(signature), signature.size(), bytes_of(data),
                            data.size()) == 1;
}

}  // namespace kivd::bench
