// The delays before each receive and send that `--socket-delays` asks for, to slow the daemon down
// in tests of its clients.
#pragma once

#include <cstdint>

namespace kivd {

// Milliseconds; 0 and below mean none.
void set_receive_delay(int32_t delay_ms);
void set_send_delay(int32_t delay_ms);

void delays_release();  // none again

[[nodiscard]] int32_t get_receive_delay();
void wait_before_receive();
void wait_before_send();

}  // namespace kivd
