// Events are not kept in memory: each accepted one is appended to private/events, a record file
// that begins with the report header of the moment at which it was started. Those of one batch of
// requests are appended together.
#pragma once

#include <cstdint>
#include <span>

namespace kivd {

// What became of the event file.
enum class event_file : bool {
    open,
    full,  // it has reached the report size limit: a report is due
};

// Stores one event, if the filter keeps it. Failures have been logged and raised; the event is then
// lost.
[[nodiscard]] event_file events_add(const char* package, const char* name,
                                    std::span<const char> payload);

// While it lives, events_add holds events back, to append several in one call; what it was given
// has to stay in its place until then. They are appended when the batch ends, and before whatever
// else looks at the file or moves it, a full file and exit() included. A forked child has none of
// them.
class event_batch {
 public:
    event_batch();
    ~event_batch();
    event_batch(const event_batch&) = delete;
    event_batch& operator=(const event_batch&) = delete;
};

// Makes sure that private/events is open and begins with a header; a new file whose header cannot
// be written whole is removed, or emptied behind a link. Failures have been logged and raised.
void events_open();

// Moves the event file, which is made if there is none, to private/flushed_data. False when that
// fails.
[[nodiscard]] bool events_flush();

// Whether there is an event file.
[[nodiscard]] bool events_pending();

// Closes the event file, which stays.
void events_release();

}  // namespace kivd
