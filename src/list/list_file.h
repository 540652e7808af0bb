// List files: the on-disk form of a sorted list. Layout and limits: format/list_record.h.
#pragma once

#include <array>
#include <cerrno>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>

#include "format/list_record.h"
#include "list/sorted_list.h"
#include "runtime/log_and_raise.h"
#include "util/numbers.h"
#include "util/unique_fd.h"

namespace kivd {

// Reads a list file, record by record.
class list_reader {
 public:
    explicit list_reader(const char* path);

    // The next record, valid until the next call; see first_list_record. Nothing at the end of the
    // file, behind 20000 records, when the file cannot be opened, and when it cannot be read on,
    // which has been logged and raised.
    [[nodiscard]] std::optional<std::string_view> next();

    // Whether the last record of the file was the last that `next` gave.
    [[nodiscard]] bool is_complete() const { return complete_; }

 private:
    void refill();

    unique_fd file_;
    bool complete_ = false;
    size_t records_ = 0;
    size_t step_ = 0;   // bytes of the record that was given last
    size_t start_ = 0;  // of what has not been stepped over
    size_t end_ = 0;    // of what has been read
    std::array<char, 32768> bytes_;
};

// Replaces a list file, through a temporary file beside it.
class list_writer {
 public:
    explicit list_writer(const char* path);  // which the caller keeps; it may be -1, see `finish`

    // One record: its fields in their order, and its end. False, with errno set, once a write has
    // failed, or a field is longer than a whole record may be (EMSGSIZE).
    void text(std::string_view field) {
        if (!make_room(field.size() + 1)) return;
        used_ += field.copy(bytes_.data() + used_, field.size());
        bytes_[used_++] = '\0';
    }
    void number(int64_t field) {
        if (!make_room(21)) return;
        char* const digits = bytes_.data() + used_;
        used_ += static_cast<size_t>(format_int64(digits, field) - digits);
        bytes_[used_++] = '\0';
    }
    [[nodiscard]] bool end_record() {
        (void)make_room(list_record_end.size());
        used_ += list_record_end.copy(bytes_.data() + used_, list_record_end.npos, 1);
        errno = error_;
        return error_ == 0;
    }

    // Puts the file into place. On failure, logged and raised, the old one is untouched and the
    // temporary one gone; `records_written` says whether the caller has been able to write them
    // all.
    [[nodiscard]] bool finish(bool records_written);

    [[nodiscard]] bool is_open() const { return file_.ok(); }

 private:
    [[nodiscard]] bool make_room(size_t size) {
        if (size <= bytes_.size() - used_) return true;
        flush();
        if (size <= bytes_.size()) return true;
        if (error_ == 0) error_ = EMSGSIZE;
        return false;
    }
    void flush();

    const char* path_;
    std::array<char, 4096> temporary_;
    unique_fd file_;
    int error_ = 0;  // errno of the first failure
    size_t used_ = 0;
    std::array<char, 32768> bytes_;
};

// Appends what `parse` makes of the records of the file at `path`: a unique_entry, or null to skip
// one. True when the whole file was read; false when it is missing, has 20000 records or more, or
// could not be read on, which has been logged and raised.
template <class entry>
bool list_load(sorted_list<entry>& list, const char* path, auto parse) {
    list_reader reader(path);
    while (const std::optional<std::string_view> record = reader.next()) {
        unique_entry<entry> parsed = parse(*record);
        if (parsed && !list.append(std::move(parsed))) {
            return log_and_raise("kivd-list", "Out of memory when adding element to list");
        }
    }
    return reader.is_complete();
}

// Replaces the file at `path` with what `write(list_writer&, const entry&)` writes of each entry:
// one record, or nothing to leave it out. `write` gives false, after logging, when end_record did.
// On failure, logged and raised, the old file is untouched.
template <class entry>
[[nodiscard]] bool list_save(const sorted_list<entry>& list, const char* path, auto write) {
    list_writer writer(path);
    if (!writer.is_open()) return false;
    return writer.finish(!list.any_of([&](const entry& each) { return !write(writer, each); }));
}

}  // namespace kivd
