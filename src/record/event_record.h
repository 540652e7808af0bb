// Writing events to a record file.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <span>

namespace kivd {

// An event on its way to a record file. Its texts and its payload stay the caller's.
struct event_record {
    const char* package;
    const char* name;
    std::span<const char> payload;
    std::array<uint8_t, 356> head;  // all of the record that precedes the payload
    size_t head_size;

    [[nodiscard]] size_t size() const { return head_size + payload.size(); }
};

inline constexpr size_t max_events_a_write = 16;

// Makes a record with the current time. False when it has no room; that has been logged and raised
// under `store_tag`.
[[nodiscard]] bool make_event_record(event_record& record, const char* package, const char* name,
                                     std::span<const char> payload, const char* store_tag);

// Appends up to max_events_a_write records to a file of `file_size` bytes, all in one call where
// that is possible. Each that could not be written whole has been logged and raised under
// `store_tag`, and cut off. Returns the size that the file has now.
[[nodiscard]] uint64_t write_event_records(int fd, uint64_t file_size,
                                           std::span<const event_record> records,
                                           const char* store_tag);

}  // namespace kivd
