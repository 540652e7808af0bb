// Writing one event to a record file.
#pragma once

#include <cstddef>
#include <optional>
#include <span>

namespace kivd {

// Appends an event record with the time of now. Gives its size in bytes, or nothing: a failure has
// been logged and raised under `store_tag`, and a part of the record may be there.
[[nodiscard]] std::optional<size_t> write_event_record(int fd, const char* package,
                                                       const char* name,
                                                       std::span<const char> payload,
                                                       const char* store_tag);

}  // namespace kivd
