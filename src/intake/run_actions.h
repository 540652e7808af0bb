// The parts "RunActions" and "RunActionsOnce" of the configuration: what runs while it is in force,
// and what is done once when it is taken.
#pragma once

namespace kivd {

// Stops the log reader that an earlier call started, and starts it anew when the configuration in
// force wants it. Without the part everything stays as it is. Failures have been logged and raised.
void run_actions();

// Does what is done once; to be called when a configuration has been taken.
void run_actions_once();

}  // namespace kivd
