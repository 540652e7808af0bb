#include "util/clock.h"

#include <sys/time.h>

#include <algorithm>
#include <ctime>

namespace kivd {
namespace {

constinit bool test_mode = false;
constexpr int64_t test_clock_start = 1262325600;  // 2010-01-01 06:00:00 UTC
constinit int64_t test_clock_seconds = test_clock_start;

}  // namespace

int64_t now_ms() {
    if (test_mode) return ++test_clock_seconds * 1000;
    timeval now = {};
    gettimeofday(&now, nullptr);
    return int64_t{now.tv_sec} * 1000 + now.tv_usec / 1000;
}

void enable_test_mode() { test_mode = true; }

void leave_test_mode() {
    test_mode = false;
    test_clock_seconds = test_clock_start;
}

bool is_test_mode() { return test_mode; }

void set_test_clock(int64_t seconds) {
    constexpr int64_t limit = INT64_MAX / 2000;  // leaves room to step and for milliseconds
    test_clock_seconds = std::clamp(seconds, -limit, limit);
}

int64_t monotonic_ms() {
    timespec now = {};
    clock_gettime(CLOCK_MONOTONIC, &now);
    return int64_t{now.tv_sec} * 1000 + now.tv_nsec / 1000000;
}

}  // namespace kivd
