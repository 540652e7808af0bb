#include "daemon/net/connection.h"

#include <unistd.h>

#include <new>
#include <utility>

#include "daemon/net/client_places.h"
#include "daemon/net/stall_guard.h"

namespace kivd {
namespace {

constinit connection* connections = nullptr;  // owns them

void take_off_list(connection& taken) {
    (taken.previous != nullptr ? taken.previous->next : connections) = taken.next;
    if (taken.next != nullptr) taken.next->previous = taken.previous;
}

bool admit(connection& admitted) {
    if (!has_place(admitted.uid) || !event_loop_add(admitted)) return false;
    if (!take_place(admitted.uid)) {
        event_loop_remove(admitted);
        return false;
    }
    admitted.waiting = false;
    return true;
}

void close_longest_waiting() {
    connection* longest = nullptr;
    for (connection* each = connections; each != nullptr; each = each->next) {
        if (each->waiting) longest = each;
    }
    if (longest != nullptr) close_connection(*longest);
}

}  // namespace

void add_connection(unique_fd fd, void (*callback)(event_handler&), uid_t uid) {
    if (!has_place(uid) && !has_waiting_place()) close_longest_waiting();
    auto* const added = new (std::nothrow) connection{};
    if (added == nullptr) return;
    added->callback = callback;
    added->fd = fd.release();
    added->uid = uid;
    added->waiting = true;
    added->next = connections;
    if (connections != nullptr) connections->previous = added;
    connections = added;
    if (!admit(*added)) take_waiting_place();
}

void admit_connection(connection& waiting) {
    leave_waiting_place();
    if (!admit(waiting)) take_waiting_place();
}

void close_connection(connection& closed) {
    const stall_guard guard;
    // Out of the loop before it is closed: a forked child may still hold a copy of the descriptor,
    // and then the loop would go on reporting it.
    if (!closed.waiting) event_loop_remove(closed);
    (void)close(closed.fd);
    closed.waiting ? leave_waiting_place() : leave_place(closed.uid);
    take_off_list(closed);
    delete &closed;
    event_loop_resume();  // there is a place for whoever is in the queue
}

connection* first_connection() { return connections; }

}  // namespace kivd
