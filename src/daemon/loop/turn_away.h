// Turning clients away when there is no descriptor left for them.
#pragma once

namespace kivd {

// Sets a descriptor aside for it, and closes that one.
void turn_away_init();
void turn_away_release();

// Takes a client that could not be accepted off the queue and hangs up on it: left there, it would
// wake the loop again and again. Where even that fails, a pause keeps the loop from spinning.
void turn_away_client(int listening_fd);

}  // namespace kivd
