// The records of list files. A field is its text and a NUL; a record is its fields, one more NUL
// and a line feed, so each ends in 00 00 0A. A file is records end to end, in list order. What goes
// beyond the limits is written, but cannot be read back.
#pragma once

#include <array>
#include <cstddef>
#include <optional>
#include <span>
#include <string_view>

namespace kivd {

inline constexpr size_t list_records_max = 20000;     // a file of so many counts as cut short
inline constexpr size_t list_record_size_max = 1024;  // bytes, its end with it
inline constexpr std::string_view list_record_end("\0\0\n", 3);  // with the NUL of the last field

// The record at the start of `bytes` without its end: its fields, but for the last one's NUL, which
// stands behind. Nothing when no record ends within the largest size.
[[nodiscard]] std::optional<std::string_view> first_list_record(std::string_view bytes);

// Finds the fields of a record. True when there are just as many and each of them is there; those
// that begin at or behind its end are null.
[[nodiscard]] bool split_list_record(std::string_view record, std::span<const char*> fields);

}  // namespace kivd
