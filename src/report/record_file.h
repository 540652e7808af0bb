// Reading and mending record files. A record file is whole records end to end and nothing else;
// records are only ever appended, so a crash can spoil the last one and no other.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <span>

namespace kivd {

// Whether a record file begins with a report header record.
enum class record_header : bool { absent, expected };

// Steps over the record at `offset`, the byte position at which `file` stands. `key` is the byte
// that the record has to start with.
//  0  `offset` is now behind the record
// -1  no whole record with that key there; `offset` unchanged. A wrong key and a failing read or
//     seek have been logged and raised; a torn record has not.
[[nodiscard]] int read_record(FILE* file, size_t file_size, size_t& offset, uint8_t key);

// Cuts the file at `path` back to its longest run of whole records, or removes it when its header
// is spoilt. A missing file is fine. Failures are logged; the caller has nothing to do.
void rescue_event_file(const char* path, record_header header);

// Appends a record (none when empty) to a file that is being written. What a store's records cannot
// be written with is logged and raised under its tag; a stream is buffered, so the last of them may
// fail only in finish_records.
void append_record(FILE* file, std::span<const uint8_t> record, const char* store_tag);
void finish_records(FILE* file, const char* store_tag);

}  // namespace kivd
