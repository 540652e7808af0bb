#include "security/seal.h"

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
bool check_report_key(const key_facts& key) {
    if (key.is_rsa && key.bits > 0 && key.bits <= int{max_report_key_bits} && key.bits % 8 == 0) {
        return true;
    }
    return log_and_raise(tag, "Report key is %s of %d bits, not RSA of at most %d in whole bytes",
                         key.type, key.bits, int{max_report_key_bits});
}

bool write_sealed(int output, const uint8_t* bytes, int size) {
    if (write_all(output, bytes, static_cast<size_t>(size))) return true;
    return log_and_raise(tag, "encrypt_file(): fwrite() failed, %s", strerror(errno));
}

}  // namespace

std::optional<sealing> start_sealing() {
    const crypto_key key = load_report_key();
    if (!key) {
        log_and_raise(tag, "Failed to open report key");
        return std::nullopt;
    }
    const key_facts facts = get_crypto()->describe_key(key.get());
    if (!check_report_key(facts)) return std::nullopt;
    sealing fresh = {};
    fresh.key_bits = static_cast<uint32_t>(facts.bits);
    fresh.cipher.reset(
        get_crypto()->start_sealing(key.get(), fresh.encrypted_key.data(), fresh.iv));
    if (!fresh.cipher) return std::nullopt;
    return fresh;
}

bool encrypt_file(int input, int output, sealing& started) {
    std::array<uint8_t, chunk_size> plain;
    std::array<uint8_t, chunk_size + cipher_block_size> sealed;
    const crypto_functions& crypto = *get_crypto();
    for (;;) {
        const ssize_t n = read(input, plain.data(), plain.size());
        if (n < 0 && errno == EINTR) continue;
        if (n < 0) {
            return log_and_raise(tag, "encrypt_file(): read() failed, %s", strerror(errno));
        }
        if (n == 0) break;
        const int size = crypto.seal(started.cipher.get(),
                                     std::span(plain).first(static_cast<size_t>(n)), sealed.data());
        if (size < 0) return log_and_raise(tag, "EVP_SealUpdate failed");
        if (!write_sealed(output, sealed.data(), size)) return false;
    }
    const int size = crypto.finish_sealing(started.cipher.get(), sealed.data());
    if (size < 0) return log_and_raise(tag, "EVP_SealFinal failed");
    return write_sealed(output, sealed.data(), size);
}

}  // namespace kivd
