#include "list/list_file.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>

#include "util/file_io.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-list";

}  // namespace

list_reader::list_reader(const char* path) : file_(open_readable(path)) {}

void list_reader::refill() {
    memmove(bytes_.data(), bytes_.data() + start_, end_ - start_);
    end_ -= start_;
    start_ = 0;
    while (end_ < bytes_.size()) {
        const ssize_t size = read(file_.get(), bytes_.data() + end_, bytes_.size() - end_);
        if (size < 0 && errno == EINTR) continue;
        if (size <= 0) return;
        end_ += static_cast<size_t>(size);
    }
}

std::optional<std::string_view> list_reader::next() {
    start_ += std::exchange(step_, 0);
    if (!file_.ok() || records_ == list_records_max) return std::nullopt;
    if (end_ - start_ < list_record_size_max) refill();
    const std::string_view left(bytes_.data() + start_, end_ - start_);
    if (left.size() < list_record_end.size()) {
        complete_ = true;
        return std::nullopt;
    }
    const std::optional<std::string_view> record = first_list_record(left);
    if (!record) {
        log_and_raise(tag, "Corrupt data when reading list");
        return std::nullopt;
    }
    ++records_;
    step_ = record->size() + list_record_end.size();
    return record;
}

list_writer::list_writer(const char* path) : path_(path) {
    snprintf(temporary_.data(), temporary_.size(), "%s_", path);
    file_ = create_file(temporary_.data());
    if (file_.ok()) return;
    log_and_raise(tag, "Failed to open list file for writing: %s", strerror(errno));
}

void list_writer::flush() {
    const size_t size = std::exchange(used_, 0);
    if (error_ == 0 && !write_all(file_.get(), bytes_.data(), size)) error_ = errno;
}

bool list_writer::finish(bool records_written) {
    flush();
    // On a full device of another kind it is the close that fails.
    const bool closed = close(file_.release()) == 0;
    if (!records_written || error_ != 0 || !closed) {
        log_and_raise(tag, "Failed to save data to list file.");
    } else if (rename(temporary_.data(), path_) == 0) {
        return true;
    } else {
        log_and_raise(tag, "Failed to rename file %s to %s: %s", temporary_.data(), path_,
                      strerror(errno));
    }
    (void)remove(temporary_.data());
    return false;
}

}  // namespace kivd
