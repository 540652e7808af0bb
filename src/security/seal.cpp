#include "security/seal.h"

#include <openssl/err.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "runtime/log_and_raise.h"
#include "security/key_paths.h"
#include "util/file_io.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd/crypto";
constexpr size_t chunk_size = 16384;

// A report gives the length of the encrypted key in bytes, so the modulus has to have whole bytes.
bool check_report_key(const EVP_PKEY* key) {
    if (key == nullptr) return log_and_raise(tag, "Failed to open report key");
    const int bits = EVP_PKEY_get_bits(key);
    if (EVP_PKEY_is_a(key, "RSA") == 1 && bits > 0 && bits <= int{max_report_key_bits} &&
        bits % 8 == 0) {
        return true;
    }
    return log_and_raise(tag, "Report key is %s of %d bits, not RSA of at most %d in whole bytes",
                         EVP_PKEY_get0_type_name(key), bits, int{max_report_key_bits});
}

bool write_sealed(int output, const uint8_t* bytes, int size) {
    if (write_all(output, bytes, static_cast<size_t>(size))) return true;
    return log_and_raise(tag, "encrypt_file(): fwrite() failed, %s", strerror(errno));
}

}  // namespace

std::optional<sealing> start_sealing() {
    const unique_pkey key = load_report_key();
    if (!check_report_key(key.get())) return std::nullopt;
    sealing fresh = {};
    fresh.key_bits = static_cast<uint32_t>(EVP_PKEY_get_bits(key.get()));
    fresh.cipher.reset(EVP_CIPHER_CTX_new());
    uint8_t* keys[] = {fresh.encrypted_key.data()};
    int key_size = 0;
    EVP_PKEY* recipients[] = {key.get()};
    if (!fresh.cipher || EVP_SealInit(fresh.cipher.get(), EVP_aes_128_cbc(), keys, &key_size,
                                      fresh.iv.data(), recipients, 1) != 1) {
        ERR_clear_error();
        return std::nullopt;
    }
    return fresh;
}

bool encrypt_file(int input, int output, sealing& started) {
    std::array<uint8_t, chunk_size> plain;
    std::array<uint8_t, chunk_size + EVP_MAX_BLOCK_LENGTH> sealed;
    int size = 0;
    for (;;) {
        const ssize_t n = read(input, plain.data(), plain.size());
        if (n < 0 && errno == EINTR) continue;
        if (n < 0) {
            return log_and_raise(tag, "encrypt_file(): read() failed, %s", strerror(errno));
        }
        if (n == 0) break;
        if (EVP_EncryptUpdate(started.cipher.get(), sealed.data(), &size, plain.data(),
                              static_cast<int>(n)) != 1) {
            return log_and_raise(tag, "EVP_SealUpdate failed");
        }
        if (!write_sealed(output, sealed.data(), size)) return false;
    }
    if (EVP_SealFinal(started.cipher.get(), sealed.data(), &size) != 1) {
        return log_and_raise(tag, "EVP_SealFinal failed");
    }
    return write_sealed(output, sealed.data(), size);
}

}  // namespace kivd
