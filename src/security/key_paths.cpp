#include "security/key_paths.h"

#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdio>

#include "util/file_io.h"
#include "util/paths.h"

namespace kivd {
namespace {

using key_path = std::array<char, 4096>;

constinit key_path report_key_path = {};
constinit key_path config_key_path = {};

void set_path(key_path& path, const char* directory, const char* name) {
    snprintf(path.data(), path.size(), "%s%s", directory, name);
}

bool is_expected(const key_path& path) {
    if (access(path.data(), R_OK) == 0) return true;
    return errno != ENOENT && errno != ENOTDIR && errno != EACCES;
}

crypto_key load_public_key(const key_path& path) {
    const unique_file file = open_to_read(path.data());
    const crypto_functions* const crypto = file ? get_crypto() : nullptr;
    return crypto_key(crypto != nullptr ? crypto->read_key(file.get()) : nullptr);
}

}  // namespace

void set_default_key_paths() {
    set_report_key_dir(paths::default_key_dir);
    set_config_key_dir(paths::default_key_dir);
}

void set_report_key_dir(const char* directory) {
    set_path(report_key_path, directory, paths::report_key_name);
}

void set_config_key_dir(const char* directory) {
    set_path(config_key_path, directory, paths::config_key_name);
}

void clear_report_key_path() { report_key_path.front() = '\0'; }

void clear_config_key_path() { config_key_path.front() = '\0'; }

bool is_sealing_on() { return is_expected(report_key_path); }

bool is_verification_on() { return is_expected(config_key_path); }

crypto_key load_report_key() { return load_public_key(report_key_path); }

crypto_key load_config_key() { return load_public_key(config_key_path); }

}  // namespace kivd
