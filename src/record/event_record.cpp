#include "record/event_record.h"

#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "format/record_format.h"
#include "runtime/log_and_raise.h"
#include "util/clock.h"
#include "util/file_io.h"

namespace kivd {
namespace {

using record_pieces = std::span<iovec, 2>;

void put_pieces(const event_record& record, record_pieces pieces) {
    pieces[0] = {const_cast<uint8_t*>(record.head.data()), record.head_size};
    pieces[1] = {const_cast<char*>(record.payload.data()), record.payload.size()};
}

// A full device may have taken a part of a record, and a reader could not find the next one behind
// it.
void cut_torn_record(int fd, uint64_t& file_size) {
    if (ftruncate(fd, static_cast<off_t>(file_size)) == 0) return;
    const off_t size = lseek(fd, 0, SEEK_END);
    if (size >= 0) file_size = static_cast<uint64_t>(size);
}

void write_one(int fd, uint64_t& file_size, const event_record& record, const char* store_tag) {
    std::array<iovec, 2> pieces;
    put_pieces(record, pieces);
    if (write_all(fd, pieces)) {
        file_size += record.size();
        return;
    }
    log_and_raise(store_tag, "Failed to write event %s::%s with %d bytes payload. Error: %s",
                  record.package, record.name, static_cast<int>(record.payload.size()),
                  strerror(errno));
    cut_torn_record(fd, file_size);
}

// Gives those that are not in the file yet, of which nothing is.
std::span<const event_record> write_at_once(int fd, uint64_t& file_size,
                                            std::span<const event_record> records) {
    std::array<iovec, 2 * max_events_a_write> pieces;
    for (size_t i = 0; i < records.size(); ++i) {
        put_pieces(records[i], std::span(pieces).subspan(2 * i).first<2>());
    }
    const ssize_t n = writev(fd, pieces.data(), static_cast<int>(2 * records.size()));
    size_t written = n > 0 ? static_cast<size_t>(n) : 0;
    while (!records.empty() && written >= records.front().size()) {
        written -= records.front().size();
        file_size += records.front().size();
        records = records.subspan(1);
    }
    if (written > 0) cut_torn_record(fd, file_size);
    return records;
}

}  // namespace

bool make_event_record(event_record& record, const char* package, const char* name,
                       std::span<const char> payload, const char* store_tag) {
    record.package = package;
    record.name = name;
    record.payload = payload;
    record.head_size = pack_event_record(record.head, package, name, now_ms(), payload.size());
    return record.head_size > 0 || log_and_raise(store_tag, "Failed to serialize header.");
}

uint64_t write_event_records(int fd, uint64_t file_size, std::span<const event_record> records,
                             const char* store_tag) {
    if (records.size() > 1) records = write_at_once(fd, file_size, records);
    for (const event_record& record : records) write_one(fd, file_size, record, store_tag);
    return file_size;
}

}  // namespace kivd
