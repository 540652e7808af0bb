// The records of list files. A field is its text and a NUL; a record is its fields, one more NUL
// and a line feed, so each ends in 00 00 0A. A file is records end to end, in list order. Of a file
// that goes beyond the limits only the beginning is read back, so nothing may be taken that would.
#pragma once

#include <array>
#include <cstddef>
#include <optional>
#include <span>
#include <string_view>

namespace kivd {

// No more records than these are read, so a file that has them all counts as cut short.
inline constexpr size_t list_records_max = 20000;
inline constexpr size_t list_record_size_max = 1024;             // bytes, its end with it
inline constexpr std::string_view list_record_end("\0\0\n", 3);  // with the NUL of the last field

// The record at the start of `bytes` without its end: its fields, but for the last one's NUL, which
// stands behind. Nothing when no record ends within the largest size.
[[nodiscard]] std::optional<std::string_view> first_list_record(std::string_view bytes);

// Whether records with so many fields can be read back when their texts have so many bytes.
[[nodiscard]] constexpr bool fits_list_record(size_t fields, size_t text_size) {
    return text_size + fields + list_record_end.size() - 1 <= list_record_size_max;
}

// Finds the fields of a record. True when there are just as many and each of them is there; those
// that begin at or behind its end are null.
[[nodiscard]] bool split_list_record(std::string_view record, std::span<const char*> fields);

}  // namespace kivd
