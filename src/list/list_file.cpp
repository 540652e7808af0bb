#include "list/list_file.h"

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "runtime/log_and_raise.h"
#include "util/file_io.h"
#include "util/numbers.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-list";
constexpr size_t path_size = 4096;
constexpr size_t buffer_size = 32768;

// A window on the file that always shows the next bytes, as many as a record may have, or all
// that are left.
class record_window {
 public:
    explicit record_window(FILE* file) : file_(file) {}

    const char* start() const { return bytes_.data() + start_; }
    size_t size() {
        if (end_ - start_ < list_record_size_max) refill();
        return end_ - start_ < list_record_size_max ? end_ - start_ : list_record_size_max;
    }
    void step(size_t size) { start_ += size; }

 private:
    void refill() {
        memmove(bytes_.data(), start(), end_ - start_);
        end_ -= start_;
        start_ = 0;
        end_ += fread(bytes_.data() + end_, 1, bytes_.size() - end_, file_);
    }

    FILE* file_;
    std::array<char, buffer_size> bytes_;
    size_t start_ = 0;
    size_t end_ = 0;
};

int give_up(unique_file file, const char* temporary) {
    file.reset();
    (void)remove(temporary);
    return 0;
}

}  // namespace

int list_load(sorted_list& list, const char* path, list_parse_fn parse, void* context) {
    const unique_file file = open_to_read(path);
    if (!file) return 0;
    setvbuf(file.get(), nullptr, _IONBF, 0);  // the window is buffer enough

    record_window window(file.get());
    for (int records = 0; records < list_records_max; ++records) {
        const size_t size = window.size();
        if (size < sizeof list_terminator) return 1;
        const char* const record = window.start();
        const void* const found = memmem(record, size, list_terminator, sizeof list_terminator);
        if (found == nullptr) {
            (void)log_and_raise(tag, "Corrupt data when reading list");
            return 0;
        }
        const auto* const end = static_cast<const char*>(found);
        void* element = parse(record, end, context);
        if (element != nullptr && list_append(list, element) == 0) {
            (void)log_and_raise(tag, "Out of memory when adding element to list");
            return 0;
        }
        window.step(static_cast<size_t>(end - record) + sizeof list_terminator);
    }
    return 0;
}

int list_save(const sorted_list& list, const char* path, list_write_fn write, void* context) {
    char temporary[path_size];
    snprintf(temporary, sizeof temporary, "%s%s", path, "_");
    unique_file file(fopen(temporary, "wbe"));
    if (!file) {
        (void)log_and_raise(tag, "Failed to open list file for writing: %s", strerror(errno));
        return 0;
    }
    char buffer[buffer_size];
    setvbuf(file.get(), buffer, _IOFBF, sizeof buffer);
    for (uint32_t i = 0; i < list.count; ++i) {
        if (write(file.get(), list.elements[i], context) != 0) continue;
        (void)log_and_raise(tag, "Failed to save data to list file.");
        return give_up(std::move(file), temporary);
    }
    if (fclose(file.release()) != 0) {  // on a full device this is where most writes fail
        (void)log_and_raise(tag, "Failed to save data to list file.");
        return give_up(nullptr, temporary);
    }
    if (rename(temporary, path) != 0) {
        (void)log_and_raise(tag, "Failed to rename file %s to %s: %s", temporary, path,
                            strerror(errno));
        return give_up(nullptr, temporary);
    }
    return 1;
}

void record_writer::put(const char* bytes, size_t size) {
    if (ok_ && fwrite_unlocked(bytes, 1, size, file_) != size) ok_ = false;
}

void record_writer::text(std::string_view field) {
    put(field.data(), field.size());
    put("", 1);
}

void record_writer::number(int64_t field) {
    char digits[21];
    char* const end = format_int64(digits, field);
    *end = '\0';
    put(digits, static_cast<size_t>(end - digits) + 1);
}

bool record_writer::finish() {
    put("\0\n", 2);
    return ok_;
}

bool split_record(const char* record, const char* end, std::span<const char*> fields) {
    std::ranges::fill(fields, nullptr);
    const char* next = record;
    for (size_t i = 0; i < fields.size(); ++i) {
        if (i > 0 && next >= end) return false;
        fields[i] = next;
        next += strlen(next) + 1;
    }
    return next == end + 1;
}

}  // namespace kivd
