// How many connections there may be, and whose.
//
// Each takes a descriptor. The daemon keeps some for its own work, and some of the places for root
// and its own user, so that they always get in; of the others no user has more than a quarter. A
// few clients of users who have no place left may wait for one.
#pragma once

#include <sys/types.h>

namespace kivd {

// Whether there is a place for a client of root; while there is none, clients wait in the queue.
[[nodiscard]] bool has_any_place();

// Whether there is one for a client of that user. False from take_place: no memory.
[[nodiscard]] bool has_place(uid_t uid);
[[nodiscard]] bool take_place(uid_t uid);
void leave_place(uid_t uid);

// The same for a client that is to wait.
[[nodiscard]] bool has_waiting_place();
void take_waiting_place();
void leave_waiting_place();

}  // namespace kivd
