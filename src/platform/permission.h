// The permission service on plain Linux.
#pragma once

#include <sys/types.h>

namespace kivd {

// Whether the process `pid` of user `uid` holds `permission`. User 0 holds every permission; the
// members of the group kiv_private hold com.vantrelis.permission.KIV_PRIVATE. The answer is looked
// up once for each user, and then kept, in the local group and user files only: a name service may
// ask the network, and the caller must not wait for that. While these cannot be read, for lack of
// memory or descriptors, nobody holds it, and the next call looks again.
[[nodiscard]] bool check_permission(const char* permission, pid_t pid, uid_t uid);

// Forgets the answers: each is looked up anew.
void forget_permissions();

}  // namespace kivd
