#include "record/event_record.h"

#include <array>
#include <cerrno>
#include <cstring>

#include "format/record_format.h"
#include "runtime/log_and_raise.h"
#include "util/clock.h"
#include "util/file_io.h"

namespace kivd {

ssize_t write_event_record(int fd, const char* package, const char* name,
                           std::span<const char> payload, const char* store_tag) {
    static constinit std::array<uint8_t, 356> head = {};
    const size_t head_size = pack_event_record(head, package, name, now_ms(), payload.size());
    if (head_size == 0) return log_and_raise(store_tag, "Failed to serialize header.");
    std::array pieces = {iovec{head.data(), head_size},
                         iovec{const_cast<char*>(payload.data()), payload.size()}};
    const ssize_t written = write_all(fd, std::span(pieces).first(payload.empty() ? 1 : 2));
    if (written >= 0) return written;
    return log_and_raise(store_tag, "Failed to write event %s::%s with %d bytes payload. Error: %s",
                         package, name, static_cast<int>(payload.size()), strerror(errno));
}

}  // namespace kivd
