#include "platform/permission.h"

#include <grp.h>
#include <pwd.h>

#include <algorithm>
#include <array>
#include <cstdio>
#include <cstring>
#include <optional>

#include "util/unique_fd.h"

namespace kivd {
namespace {

constexpr char private_permission[] = "com.vantrelis.permission.KIV_PRIVATE";
constexpr char private_group[] = "kiv_private";

// The files are read directly: a name service may ask the network and hold the event loop.
bool is_member(const passwd& user) {
    const unique_file groups(fopen("/etc/group", "re"));
    if (!groups) return false;
    while (const group* entry = fgetgrent(groups.get())) {
        if (strcmp(entry->gr_name, private_group) != 0) continue;
        if (entry->gr_gid == user.pw_gid) return true;
        for (char** member = entry->gr_mem; *member != nullptr; ++member) {
            if (strcmp(*member, user.pw_name) == 0) return true;
        }
    }
    return false;
}

bool is_private_user(uid_t uid) {
    const unique_file users(fopen("/etc/passwd", "re"));
    if (!users) return false;
    while (const passwd* entry = fgetpwent(users.get())) {
        if (entry->pw_uid == uid && is_member(*entry)) return true;  // a uid may have two names
    }
    return false;
}

struct answer {
    uid_t uid;
    bool granted;
};
constinit std::array<std::optional<answer>, 256> cache = {};

}  // namespace

bool check_permission(const char* permission, pid_t /*pid*/, uid_t uid) {
    if (uid == 0) return true;
    if (strcmp(permission, private_permission) != 0) return false;

    std::optional<answer>& cached = cache[uid % cache.size()];
    if (!cached || cached->uid != uid) cached = answer{uid, is_private_user(uid)};
    return cached->granted;
}

void forget_permissions() { cache = {}; }

}  // namespace kivd
