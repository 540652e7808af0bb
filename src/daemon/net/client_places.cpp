#include "daemon/net/client_places.h"

#include <sys/resource.h>

#include <algorithm>
#include <cstdint>

#include "util/user_counts.h"

namespace kivd {
namespace {

constexpr rlim_t own_descriptors = 32;  // for reports, saves and all else that opens files
constexpr rlim_t most_places = 16384;   // bounds the memory that connections take

constinit user_counts taken;
constinit uint32_t all_taken = 0;
constinit uint32_t unprivileged_taken = 0;
constinit uint32_t waiting = 0;

uint32_t all_places() {
    rlimit limit = {};
    if (getrlimit(RLIMIT_NOFILE, &limit) != 0) return most_places;
    const rlim_t kept = std::min(own_descriptors, limit.rlim_cur / 2);
    return static_cast<uint32_t>(std::min(limit.rlim_cur - kept, most_places));
}

uint32_t kept_places(uint32_t places) { return std::clamp(places / 8, 2U, 64U); }

}  // namespace

bool has_any_place() { return all_taken + waiting < all_places(); }

bool has_place(uid_t uid) {
    const uint32_t places = all_places();
    if (is_privileged(uid)) return has_any_place();
    return unprivileged_taken + kept_places(places) < places &&
           taken.of(uid) < std::max(places / 4, 1U);
}

bool take_place(uid_t uid) {
    if (!taken.add(uid)) return false;
    ++all_taken;
    if (!is_privileged(uid)) ++unprivileged_taken;
    return true;
}

void leave_place(uid_t uid) {
    taken.remove(uid);
    --all_taken;
    if (!is_privileged(uid)) --unprivileged_taken;
}

bool has_waiting_place() { return waiting < kept_places(all_places()) / 2; }

void take_waiting_place() { ++waiting; }

void leave_waiting_place() { --waiting; }

}  // namespace kivd
