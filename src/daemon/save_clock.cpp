#include "daemon/save_clock.h"

#include <algorithm>
#include <climits>
#include <ctime>

#include "store/counter_store.h"
#include "store/static_store.h"

namespace kivd {
namespace {

constexpr int32_t max_interval = INT32_MAX / 1000;  // the loop waits in 32-bit milliseconds

constinit int32_t save_interval = 600;
constinit int64_t last_save = 0;  // seconds since the epoch

}  // namespace

void set_save_interval(int32_t seconds) { save_interval = std::min(seconds, max_interval); }

int32_t seconds_until_save() {
    // The system clock may have been set back or forward by any amount.
    const int64_t left = last_save + save_interval - time(nullptr);
    return static_cast<int32_t>(std::clamp(left, int64_t{0}, int64_t{save_interval}));
}

void mark_saved() { last_save = time(nullptr); }

void save_data() {
    counters_save();
    sdata_save();
    mark_saved();
}

}  // namespace kivd
