#include "config/limits.h"

#include "util/clock.h"

namespace kivd {
namespace {

constinit limits in_force;
constinit limits base;

}  // namespace

limits& get_limits() { return in_force; }

limits& get_base_limits() { return base; }

void limits_release() { in_force = base = default_limits; }

int64_t expiry_cutoff_ms(uint32_t age_seconds) {
    return age_seconds == 0 ? 0 : now_ms() - int64_t{1000} * age_seconds;
}

}  // namespace kivd
