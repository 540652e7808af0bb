#include "store/events.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <optional>

#include "config/filters.h"
#include "config/limits.h"
#include "record/event_record.h"
#include "record/header_record.h"
#include "runtime/log_and_raise.h"
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

// A full device may have taken a part of a record, and a reader could not find the next one behind
// it.
void cut_torn_record() {
    if (ftruncate(events_fd, static_cast<off_t>(events_size)) != 0) measure_size();
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

event_file events_add(const char* package, const char* name, std::span<const char> payload) {
    if (!filter_match(filter_kind::events, package, name)) return event_file::open;
    events_open();
    if (events_fd < 0) return event_file::open;
    if (const std::optional size = write_event_record(events_fd, package, name, payload, tag)) {
        events_size += *size;
    } else {
        cut_torn_record();
    }
    return events_size >= get_limits().max_report_size ? event_file::full : event_file::open;
}

bool events_flush() {
    events_open();
    events_release();
    return !is_empty() && rename(paths::events, paths::flushed_data) == 0;
}

bool events_pending() { return access(paths::events, F_OK) == 0; }

void events_release() {
    if (events_fd >= 0) (void)close(events_fd);
    events_fd = -1;
    events_size = 0;
}

}  // namespace kivd
