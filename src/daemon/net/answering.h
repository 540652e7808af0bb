// Sending answers. What a client doesn't take at once waits in its connection.
#pragma once

#include "daemon/net/connection.h"
#include "daemon/request/request.h"

namespace kivd {

// Sends an answer after the send delay; its text is at `text`. `receiver`, a literal, is the name
// under which a failure is logged and raised. When the client has no room for it, it stays in the
// connection, and the next packet unread, until it can be sent or its time is over: 3 seconds for a
// text, 1 for a descriptor. Raises no signal.
void send_answer(connection& to, answer given, const char* text, const char* receiver);

// Tries again to send the answer that waits.
void continue_answer(connection& to);

// The same, but gives up when its time is over.
void expire_answer(connection& to, int64_t now_ms);

}  // namespace kivd
