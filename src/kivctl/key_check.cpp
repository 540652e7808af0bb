#include "kivctl/key_check.h"

#include <grp.h>
#include <openssl/err.h>
#include <openssl/pem.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>

#include "kivctl/file_rights.h"
#include "security/seal.h"
#include "toolkit/unique_openssl.h"
#include "util/file_io.h"

namespace kivd {
namespace {

bool is_usable(const EVP_PKEY* key, key_use use) {
    if (key == nullptr) return false;
    const bool is_rsa = EVP_PKEY_is_a(key, "RSA") == 1;
    if (use == key_use::verify_configurations) {  // with a digest of SHA-1
        return is_rsa || EVP_PKEY_is_a(key, "EC") == 1 || EVP_PKEY_is_a(key, "DSA") == 1;
    }
    const int bits = EVP_PKEY_get_bits(key);
    return is_rsa && bits > 0 && bits <= int{max_report_key_bits} && bits % 8 == 0;
}

// With the rights of this process.
key_verdict inspect(const char* path, key_use use) {
    if (access(path, R_OK) != 0) {
        if (errno == EACCES) return key_verdict::unreadable;
        return errno == ENOENT || errno == ENOTDIR ? key_verdict::missing : key_verdict::unknown;
    }
    const unique_file file = open_to_read(path);
    if (!file) return key_verdict::unusable;
    char no_pass_phrase[] = "";
    const unique_pkey key(PEM_read_PUBKEY(file.get(), nullptr, nullptr, no_pass_phrase));
    ERR_clear_error();
    return is_usable(key.get(), use) ? key_verdict::usable : key_verdict::unusable;
}

bool become(const user_ids& user, std::optional<pid_t> pid) {
    if (pid) {
        const std::string root = "/proc/" + std::to_string(*pid) + "/root";
        if (chroot(root.c_str()) != 0 || chdir("/") != 0) return false;
    }
    return setgroups(user.groups.size(), user.groups.data()) == 0 && setgid(user.gid) == 0 &&
           setuid(user.uid) == 0;
}

// In a child that has become the daemon's user.
key_verdict inspect_as(const user_ids& user, std::optional<pid_t> pid, const char* path,
                       key_use use) {
    const pid_t child = fork();
    if (child < 0) return key_verdict::unknown;
    if (child == 0) {
        const auto seen = become(user, pid) ? inspect(path, use) : key_verdict::unknown;
        _exit(static_cast<int>(seen));
    }
    int status = 0;
    while (waitpid(child, &status, 0) < 0) {
        if (errno != EINTR) return key_verdict::unknown;
    }
    if (!WIFEXITED(status)) return key_verdict::unknown;
    return static_cast<key_verdict>(WEXITSTATUS(status));
}

}  // namespace

key_verdict check_key(const std::string& path, key_use use, const std::optional<user_ids>& user,
                      std::optional<pid_t> pid) {
    if (user && user->uid == geteuid() && user->uid != 0) return inspect(path.c_str(), use);
    if (user && geteuid() == 0) return inspect_as(*user, pid, path.c_str(), use);
    const key_verdict seen = inspect(path.c_str(), use);
    if (seen == key_verdict::missing || is_open_to_all(path, S_IROTH)) return seen;
    return key_verdict::unknown;
}

}  // namespace kivd
