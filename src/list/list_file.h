// List files: the on-disk form of a sorted list. A field is its text and a NUL; a record is its
// fields, one more NUL and a line feed, so each ends in 00 00 0A and is at most 1024 bytes long to
// be readable. A file is records end to end, in list order, at most 20000 of them.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <span>
#include <string_view>

#include "list/sorted_list.h"

namespace kivd {

inline constexpr int list_records_max = 20000;
inline constexpr size_t list_record_size_max = 1024;  // bytes, its end with it
inline constexpr char list_terminator[] = {'\0', '\0', '\n'};

// Makes an element of one record, or null to skip it. `terminator` is the first of the three bytes
// that end the record: the last field's NUL.
using list_parse_fn = void* (*)(const char* record, const char* terminator, void* context);

// Writes one record, or nothing to leave the element out. 0 when the write failed, after logging.
using list_write_fn = int (*)(FILE* file, const void* element, void* context);

// Appends the records of the file at `path` to `list`. 1 when the whole file was read; 0 when it is
// missing, has 20000 records or more, or could not be read on, which has been logged and raised.
int list_load(sorted_list& list, const char* path, list_parse_fn parse, void* context);

// Replaces the file at `path`, through a temporary file beside it. On failure (0; logged and
// raised) the old file is untouched and the temporary one gone.
[[nodiscard]] int list_save(const sorted_list& list, const char* path, list_write_fn write,
                            void* context);

// Writes the fields of one record. Buffered by the stream, so a failure may show only later.
class record_writer {
 public:
    explicit record_writer(FILE* file) : file_(file) {}
    void text(std::string_view field);
    void number(int64_t field);
    // Ends the record; false, with errno set, when any of its bytes could not be written.
    [[nodiscard]] bool finish();

 private:
    void put(const char* bytes, size_t size);

    FILE* file_;
    bool ok_ = true;
};

// The five text fields that the records of counters and static data have.
using record_fields = std::array<const char*, 5>;

// Finds the fields of a record; those that begin at or behind the terminator are null. True when
// all are there and the last one ends exactly at the terminator.
[[nodiscard]] bool split_record(const char* record, const char* terminator,
                                std::span<const char*> fields);

}  // namespace kivd
