#include "store/events.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <span>
#include <utility>

#include "config/filters.h"
#include "config/limits.h"
#include "record/event_record.h"
#include "record/header_record.h"
#include "runtime/log_and_raise.h"
#include "util/parent_memory.h"
#include "util/paths.h"
#include "util/unique_fd.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-events";

constinit int events_fd = -1;
constinit uint64_t events_size = 0;

// The file is only ever appended to, so this is its size.
void measure_size() {
    const off_t size = lseek(events_fd, 0, SEEK_END);
    if (size >= 0) events_size = static_cast<uint64_t>(size);
}

// Events of the current batch, which are not in the file yet.
struct held_events {
    std::array<event_record, max_events_a_write> records;
    size_t count;
    uint64_t size;  // of all records in bytes
};
constinit parent_memory<held_events> held;
constinit bool is_holding = false;
constinit bool is_written_at_exit = false;

void write_held() {
    if (!is_holding || held->count == 0) return;
    const std::span records(held->records.data(), std::exchange(held->count, 0));
    held->size = 0;
    events_size = write_event_records(events_fd, events_size, records, tag);
}

// False when there is no memory for it: each event is then written at once.
bool prepare_holding() {
    if (!is_written_at_exit) is_written_at_exit = atexit(write_held) == 0;
    if (is_written_at_exit && !held) held = map_parent_memory<held_events>();
    return held != nullptr;
}

bool is_full(uint64_t size) { return size >= get_limits().max_report_size; }

void hold_event(const char* package, const char* name, std::span<const char> payload) {
    event_record& record = held->records[held->count];
    if (!make_event_record(record, package, name, payload, tag)) return;
    ++held->count;
    held->size += record.size();
    if (held->count == held->records.size() || is_full(events_size + held->size)) write_held();
}

void write_event(const char* package, const char* name, std::span<const char> payload) {
    event_record record;
    if (!make_event_record(record, package, name, payload, tag)) return;
    events_size = write_event_records(events_fd, events_size, {&record, 1}, tag);
}

// A report that began without its header could not be read, so such a file is not kept. A link is,
// since somebody wants events elsewhere.
void start_file() {
    if (write_report_header(events_fd)) {
        measure_size();
        return;
    }
    (void)!ftruncate(events_fd, 0);
    events_release();
    struct stat status = {};
    if (lstat(paths::events, &status) != 0 || !S_ISLNK(status.st_mode)) (void)unlink(paths::events);
}

bool is_empty() {
    struct stat status = {};
    return stat(paths::events, &status) == 0 && status.st_size == 0;
}

}  // namespace

void events_open() {
    if (events_fd >= 0) return;
    events_fd = open(paths::events, O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0700);
    if (events_fd < 0) {
        log_and_raise(tag, "Failed to open partial event file: %s", strerror(errno));
        return;
    }
    measure_size();
    if (events_size == 0) start_file();
}

event_batch::event_batch() { is_holding = prepare_holding(); }

event_batch::~event_batch() {
    write_held();
    is_holding = false;
}

event_file events_add(const char* package, const char* name, std::span<const char> payload) {
    if (!filter_match(filter_kind::events, package, name)) return event_file::open;
    events_open();
    if (events_fd < 0) return event_file::open;
    is_holding ? hold_event(package, name, payload) : write_event(package, name, payload);
    return is_full(events_size) ? event_file::full : event_file::open;
}

bool events_flush() {
    events_open();
    events_release();
    return !is_empty() && rename(paths::events, paths::flushed_data) == 0;
}

bool events_pending() { return access(paths::events, F_OK) == 0; }

void events_release() {
    write_held();
    if (events_fd >= 0) (void)close(events_fd);
    events_fd = -1;
    events_size = 0;
}

}  // namespace kivd
