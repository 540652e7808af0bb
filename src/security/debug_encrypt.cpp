#include "security/debug_encrypt.h"

#include <fcntl.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <optional>
#include <span>

#include "runtime/log_and_raise.h"
#include "security/seal.h"
#include "util/file_io.h"
#include "util/unique_fd.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd/crypto";

unique_fd create_beside(const char* path, const char* suffix) {
    char name[4097];
    snprintf(name, sizeof name, "%s%s", path, suffix);
    return create_file(name);
}

void write_beside(const char* path, const char* suffix, std::span<const uint8_t> bytes) {
    const unique_fd file = create_beside(path, suffix);
    if (!file.ok() || write_all(file.get(), bytes.data(), bytes.size())) return;
    log_and_raise(tag, "debug_encrypt(), fwrite() failed, %s ", strerror(errno));
}

}  // namespace

void debug_encrypt(const char* path) {
    const unique_fd input(open(path, O_RDONLY | O_CLOEXEC));
    if (!input.ok()) {
        perror("File not found.");
        return;
    }
    std::optional<sealing> started = start_sealing();
    if (!started) return;
    write_beside(path, ".key", started->key());
    write_beside(path, ".iv", started->iv);
    const unique_fd output = create_beside(path, ".enc");
    if (output.ok()) (void)encrypt_file(input.get(), output.get(), *started);
}

}  // namespace kivd
