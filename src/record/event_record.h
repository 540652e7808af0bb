// Writing one event to a record file.
#pragma once

#include <cstddef>
#include <optional>
#include <span>

namespace kivd {

// Appends an event record with the current time. Returns its size in bytes, or nothing: the failure
// has then been logged and raised under `store_tag`, and a part of the record may be in the file.
[[nodiscard]] std::optional<size_t> write_event_record(int fd, const char* package,
                                                       const char* name,
                                                       std::span<const char> payload,
                                                       const char* store_tag);

}  // namespace kivd
