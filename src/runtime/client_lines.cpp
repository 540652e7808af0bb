#include "runtime/client_lines.h"

#include <cstdint>
#include <mutex>
#include <utility>

#include "platform/android_log.h"
#include "util/clock.h"
#include "util/mutex.h"

namespace kivd {
namespace {

constexpr unsigned most_lines = 200;  // in a period
constexpr int64_t period_ms = 1000;

constinit thread_local line_cause current_cause = line_cause::daemon;

constinit mutex guard;  // guards everything below; a forked child does not take it
constinit int64_t period_start_ms = 0;
constinit unsigned lines = 0;
constinit unsigned left_out = 0;

void begin_period_when_due() {
    const int64_t now_ms = monotonic_ms();
    if (now_ms - period_start_ms < period_ms) return;
    period_start_ms = now_ms;
    lines = 0;
    if (left_out == 0) return;
    __android_log_print(ANDROID_LOG_WARN, "kivd", "%u more like this", std::exchange(left_out, 0));
}

}  // namespace

line_cause_scope::line_cause_scope(line_cause cause)
    : before_(std::exchange(current_cause, cause)) {}

line_cause_scope::~line_cause_scope() { current_cause = before_; }

bool take_line() {
    if (current_cause == line_cause::daemon) return true;
    const std::lock_guard lock(guard);
    begin_period_when_due();
    const bool allowed = lines < most_lines;
    ++(allowed ? lines : left_out);
    return allowed;
}

bool are_lines_left_out() {
    const std::lock_guard lock(guard);
    return left_out > 0;
}

void tell_lines_left_out() {
    const std::lock_guard lock(guard);
    if (left_out > 0) begin_period_when_due();
}

void line_cause_forget() { current_cause = line_cause::daemon; }

}  // namespace kivd
