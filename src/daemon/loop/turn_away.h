// Turning clients away when there is no descriptor left for them.
#pragma once

namespace kivd {

// Sets a descriptor aside to do it with, and gives it back.
void turn_away_init();
void turn_away_release();

// Takes a client that could not be accepted off the queue and hangs up on it: left there, it would
// wake the loop again at once, for ever. Where even that fails, the loop at least doesn't spin.
void turn_away_client(int listening_fd);

}  // namespace kivd
