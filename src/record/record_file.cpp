#include "record/record_file.h"

#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <optional>
#include <utility>

#include "format/record_format.h"
#include "format/varint.h"
#include "platform/android_log.h"
#include "runtime/log_and_raise.h"
#include "util/file_io.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-util";

// A key byte and the longest varint of a length. Every record is longer, so fewer bytes at the end
// of a file are a torn record.
using record_head = std::array<uint8_t, 1 + max_varint32_size>;

// The size of the whole record; nothing when it cannot have such a length.
std::optional<size_t> size_of_record(const record_head& head) {
    std::span<const uint8_t> rest = std::span(head).subspan(1);
    const std::optional<uint64_t> length = take_varint(rest, max_varint32_size);
    if (!length || static_cast<int32_t>(*length) < 0) return std::nullopt;
    return head.size() - rest.size() + static_cast<uint32_t>(*length);
}

void cut_file(const char* path, size_t size) {
    if (truncate(path, static_cast<off_t>(size)) == 0) return;
    log_and_raise(tag, "Failed to truncate event file <%s> at %zu :%s", path, size,
                  strerror(errno));
    (void)remove(path);  // nothing may be appended behind a torn record
}

}  // namespace

bool read_record(FILE* file, size_t file_size, size_t& offset, uint8_t key) {
    record_head head;
    const size_t bytes_read = fread(head.data(), 1, head.size(), file);
    if (bytes_read == 0) {
        const int error = ferror(file) != 0 ? errno : ENODATA;  // the file ends here
        return log_and_raise(tag, "Failed to read file: %s", strerror(error));
    }
    if (bytes_read < head.size()) return false;
    if (head[0] != key) {
        return log_and_raise(tag, "Expected tag %d, found %d", key, head[0]);
    }
    const std::optional<size_t> size = size_of_record(head);
    if (!size || *size > file_size - offset) return false;
    if (fseeko(file, static_cast<off_t>(*size) - static_cast<off_t>(bytes_read), SEEK_CUR) != 0) {
        return log_and_raise(tag, "Failed to fseek: %s", strerror(errno));
    }
    offset += *size;
    return true;
}

void rescue_event_file(const char* path, record_header header) {
    unique_file file = open_to_read(path);
    if (!file) {
        if (errno == ENOENT) return;
        __android_log_print(ANDROID_LOG_ERROR, tag, "Failed to open event file <%s> to rescue: %s",
                            path, strerror(errno));
        return;
    }
    const std::optional<uint64_t> file_size = get_file_size(file.get());
    if (!file_size) {
        __android_log_print(ANDROID_LOG_WARN, tag, "Failed to get event file size on <%s>.", path);
        file.reset();
        (void)remove(path);
        return;
    }
    const size_t size = *file_size;
    size_t offset = 0;
    if (header == record_header::expected &&
        !read_record(file.get(), size, offset, header_record_key)) {
        __android_log_print(ANDROID_LOG_WARN, tag, "Header is corrupt in <%s>.", path);
        file.reset();
        (void)remove(path);
        return;
    }
    while (offset < size) {
        if (read_record(file.get(), size, offset, event_record_key)) continue;
        __android_log_print(ANDROID_LOG_WARN, tag, "Event is corrupt in <%s>.", path);
        file.reset();
        cut_file(path, offset);
        return;
    }
}

void record_appender::flush(const char* store_tag) {
    const size_t size = std::exchange(used_, 0);
    if (write_all(fd_, buffer_.data(), size)) {
        file_size_ += size;
        return;
    }
    log_and_raise(store_tag, "Failed to write PB to file: %s", strerror(errno));
    (void)!ftruncate(fd_, static_cast<off_t>(file_size_));
}

}  // namespace kivd
