#include "record/event_record.h"

#include <array>
#include <cerrno>
#include <cstring>

#include "format/record_format.h"
#include "runtime/log_and_raise.h"
#include "util/clock.h"
#include "util/file_io.h"

namespace kivd {

std::optional<size_t> write_event_record(int fd, const char* package, const char* name,
                                         std::span<const char> payload, const char* store_tag) {
    std::array<uint8_t, 356> head;
    const size_t head_size = pack_event_record(head, package, name, now_ms(), payload.size());
    if (head_size == 0) {
        log_and_raise(store_tag, "Failed to serialize header.");
        return std::nullopt;
    }
    std::array pieces = {iovec{head.data(), head_size},
                         iovec{const_cast<char*>(payload.data()), payload.size()}};
    if (write_all(fd, std::span(pieces).first(payload.empty() ? 1 : 2))) {
        return head_size + payload.size();
    }
    log_and_raise(store_tag, "Failed to write event %s::%s with %d bytes payload. Error: %s",
                  package, name, static_cast<int>(payload.size()), strerror(errno));
    return std::nullopt;
}

}  // namespace kivd
