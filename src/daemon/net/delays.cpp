#include "daemon/net/delays.h"

#include "runtime/stop.h"

namespace kivd {
namespace {

constinit int32_t receive_delay_ms = 0;
constinit int32_t send_delay_ms = 0;

void wait(int32_t delay_ms) {
    if (delay_ms > 0) wait_for_stop(delay_ms);
}

}  // namespace

void set_receive_delay(int32_t delay_ms) { receive_delay_ms = delay_ms; }

void set_send_delay(int32_t delay_ms) { send_delay_ms = delay_ms; }

void delays_release() { receive_delay_ms = send_delay_ms = 0; }

int32_t get_receive_delay() { return receive_delay_ms; }

void wait_before_receive() { wait(receive_delay_ms); }

void wait_before_send() { wait(send_delay_ms); }

}  // namespace kivd
