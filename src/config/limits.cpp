#include "config/limits.h"

#include "util/clock.h"

namespace kivd {
namespace {

constexpr limits defaults = {
    default_max_report_size, default_max_output_dir_size, default_expire_age,
    default_expire_age,      default_expire_age,          default_expire_age,
};
constinit limits in_force = defaults;

}  // namespace

void init_settings() { in_force = defaults; }

limits& get_limits() { return in_force; }

int64_t expiry_cutoff_ms(uint32_t age_seconds) {
    return age_seconds == 0 ? 0 : now_ms() - int64_t{1000} * age_seconds;
}

}  // namespace kivd
