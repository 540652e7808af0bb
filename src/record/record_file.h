// Reading and mending record files. A record file consists of whole records end to end. They are
// only ever appended, so a crash can spoil no record but the last.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <span>

namespace kivd {

// Whether a record file begins with a report header record.
enum class record_header : bool { absent, expected };

// Steps over the record at `offset`, the byte position at which `file` stands. `key` is the byte
// that the record has to start with.
// True when `offset` is now behind it. False, with `offset` unchanged, when no whole record with
// that key is there: a wrong key and a failing read or seek have been logged and raised, a torn
// record has not.
[[nodiscard]] bool read_record(FILE* file, size_t file_size, size_t& offset, uint8_t key);

// Cuts the file at `path` back to its longest run of whole records, or removes it when its header
// is spoilt. A missing file is fine. Failures are logged; the caller has nothing to do.
void rescue_event_file(const char* path, record_header header);

// Appends records to a file, several at a time. Records that cannot be written are left out whole:
// the file then ends at the record before them, and later ones are tried again.
class record_appender {
 public:
    // `fd`, which stays the caller's, is open for appending and stands at its end.
    record_appender(int fd, uint64_t file_size) : fd_(fd), file_size_(file_size) {}

    // Has `pack(room)` put a record into room for `largest` bytes; it gives the record's size, or 0
    // to leave it out. A failure to write those before it is logged and raised under `store_tag`,
    // as in `flush`.
    void append(size_t largest, const char* store_tag, auto pack) {
        if (largest > buffer_.size() - used_) flush(store_tag);
        used_ += pack(std::span(buffer_).subspan(used_, largest));
    }

    // Writes what `append` has taken.
    void flush(const char* store_tag);

 private:
    int fd_;
    uint64_t file_size_;  // whole records so far
    std::array<uint8_t, 32768> buffer_;
    size_t used_ = 0;
};

}  // namespace kivd
