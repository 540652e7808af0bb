// A client's connection, and the list of all.
//
// The daemon never waits for a client: what a client has begun to send, and what it has not yet
// read of an answer, is kept here with a deadline, and the loop goes on.
#pragma once

#include <sys/types.h>

#include <array>
#include <cstddef>
#include <cstdint>
#include <memory>

#include "daemon/loop/event_loop.h"
#include "daemon/net/packet_buffer.h"
#include "daemon/net/stream_framing.h"
#include "util/unique_fd.h"

namespace kivd {

// A packet of a stream that has not arrived whole. Times are of the monotonic clock.
struct unfinished_packet {
    packet_buffer buffer;
    size_t size;  // bytes that are there
    stream_header header;
    int64_t deadline_ms;      // for the whole packet
    int64_t gap_deadline_ms;  // for the next piece
};

// An answer, or what is left of it, that could not be sent at once.
struct unsent_answer {
    std::array<char, max_reply_size> text;
    size_t size;  // of the text
    size_t sent;
    unique_fd descriptor;  // ok: goes out instead of the text
    const char* receiver;  // the name of its receive callback, for messages
    int64_t deadline_ms;
};

// Reads packets while it has neither of the two; while an answer waits, the next packet stays
// unread.
struct connection : event_handler {
    uid_t uid;     // of the peer
    bool waiting;  // for a place; until then it is not in the loop
    std::unique_ptr<unfinished_packet> packet;
    std::unique_ptr<unsent_answer> answer;
    connection* previous;
    connection* next;  // the one that was added before
};

// Puts a connection on the list, and when its user has a place (daemon/net/client_places.h) into
// the loop; else it waits for one. Nothing when there is no memory, or no place to wait in: the
// longest waiting gives way then.
void add_connection(unique_fd fd, void (*callback)(event_handler&), uid_t uid);

// Puts a connection that waits into the loop if there is a place for it by now.
void admit_connection(connection& waiting);

// Takes it out of the loop and off the list, and frees it.
void close_connection(connection& closed);

// The connection that was added last; null when there is none.
[[nodiscard]] connection* first_connection();

}  // namespace kivd
