#include "daemon/loop/save_clock.h"

#include <algorithm>
#include <climits>
#include <ctime>

#include "store/counters.h"
#include "store/static_data.h"

namespace kivd {
namespace {

constexpr int32_t max_interval = INT32_MAX / 1000;  // the loop waits in 32-bit milliseconds

constexpr int32_t usual_interval = 600;

constinit int32_t save_interval = usual_interval;
constinit int64_t last_save = 0;  // seconds since the epoch

}  // namespace

void set_save_interval(int32_t seconds) { save_interval = std::min(seconds, max_interval); }

int32_t seconds_until_save() {
    const int64_t now = time(nullptr);
    last_save = std::min(last_save, now);  // the system clock may have been set back, by years
    return static_cast<int32_t>(std::max(last_save + save_interval - now, int64_t{0}));
}

void mark_saved() { last_save = time(nullptr); }

void save_data() {
    counters_save();
    static_data_save();
    mark_saved();
}

void save_clock_release() {
    save_interval = usual_interval;
    last_save = 0;
}

}  // namespace kivd
