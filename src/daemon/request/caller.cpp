#include "daemon/request/caller.h"

#include <unistd.h>

#include <cstring>
#include <optional>

#include "platform/permission.h"
#include "runtime/log_and_raise.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd";
constexpr char private_permission[] = "com.vantrelis.permission.KIV_PRIVATE";

std::optional<ucred> sender_of(const msghdr& message) {
    if (message.msg_controllen < sizeof(cmsghdr)) return std::nullopt;
    auto& headers = const_cast<msghdr&>(message);  // CMSG_NXTHDR asks for it and changes nothing
    for (cmsghdr* control = CMSG_FIRSTHDR(&headers); control != nullptr;
         control = CMSG_NXTHDR(&headers, control)) {
        if (control->cmsg_level != SOL_SOCKET || control->cmsg_type != SCM_CREDENTIALS) continue;
        ucred credentials;
        memcpy(&credentials, CMSG_DATA(control), sizeof credentials);
        return credentials;
    }
    return std::nullopt;
}

std::optional<ucred> peer_of(int fd) {
    ucred credentials;
    socklen_t size = sizeof credentials;
    if (getsockopt(fd, SOL_SOCKET, SO_PEERCRED, &credentials, &size) == 0) return credentials;
    log_and_raise(tag, "Failed to obtain user credentials");
    return std::nullopt;
}

}  // namespace

uid_t user_of(const request& r) {
    if (r.sender.message == nullptr) return r.sender.uid;
    const std::optional<ucred> credentials = sender_of(*r.sender.message);
    return credentials ? credentials->uid : unknown_user;
}

bool check_caller_permission(const request& r) {
    const std::optional<ucred> caller =
        r.sender.message != nullptr ? sender_of(*r.sender.message) : peer_of(r.sender.fd);
    if (!caller) return false;
    return caller->uid == getuid() ||
           check_permission(private_permission, caller->pid, caller->uid);
}

}  // namespace kivd
