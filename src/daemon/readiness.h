// Telling a service manager how far the daemon is.
#pragma once

namespace kivd {

// Sends `state`, such as "READY=1", to the socket that $NOTIFY_SOCKET names, if there is one: an
// absolute path, or with "@" in front a name that is no file. Never waits; nobody is told of a
// failure.
void tell_service_manager(const char* state);

}  // namespace kivd
