#include "toolkit/unpacked_bytes.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <new>
#include <utility>

#include "util/bytes.h"

namespace kivd {
namespace {
constexpr int gzip_only = 16 + MAX_WBITS;
constexpr size_t piece_size = 65536;

// Null, with errno set, when it cannot be opened.
FILE* open_source(const std::string& path) {
    if (path != "-") return fopen(path.c_str(), "re");
    const int fd = fcntl(STDIN_FILENO, F_DUPFD_CLOEXEC, 0);
    return fd < 0 ? nullptr : fdopen(fd, "re");
}

}  // namespace

unpacked_bytes::unpacked_bytes(const std::string& path)
    : place_("the file"), file_(open_source(path)) {
    if (!file_) {
        fail(std::string("cannot be opened: ") + strerror(errno));
        return;
    }
    if (fill()) start();
}

unpacked_bytes::unpacked_bytes(std::string_view bytes, const char* place) : place_(place) {
    // zlib's input pointer is not const, but zlib never writes through it.
    inflater_.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(bytes.data()));
    inflater_.avail_in = static_cast<uInt>(bytes.size());
    bytes_read_ = bytes.size();
    start();
}

// Decides by the first bytes whether this is gzip.
void unpacked_bytes::start() {
    is_gzip_ = text_of({inflater_.next_in, inflater_.avail_in}).starts_with(gzip_magic);
    if (is_gzip_ && inflateInit2(&inflater_, gzip_only) != Z_OK) throw std::bad_alloc();
    in_member_ = is_gzip_;
}

unpacked_bytes::~unpacked_bytes() {
    if (is_gzip_) inflateEnd(&inflater_);
}

bool unpacked_bytes::fail(std::string problem) {
    problem_ = std::move(problem);
    return false;
}

std::string unpacked_bytes::position() const {
    return "byte " + std::to_string(offset()) + " of " + place_;
}

// Makes sure that there is input. False at the end of the source and after a problem.
bool unpacked_bytes::fill() {
    if (inflater_.avail_in > 0) return true;
    if (!file_) return false;
    const size_t size = fread(input_.data(), 1, input_.size(), file_.get());
    if (size == 0 && ferror(file_.get())) {
        return fail(std::string("cannot be read: ") + strerror(errno));
    }
    inflater_.next_in = input_.data();
    inflater_.avail_in = static_cast<uInt>(size);
    bytes_read_ += size;
    return size > 0;
}

bool unpacked_bytes::start_member() {
    if (!fill()) return false;  // a good end
    if (static_cast<char>(*inflater_.next_in) != gzip_magic[0]) {
        has_foreign_tail_ = true;
        return fail("bytes that are not gzip data follow at " + position());
    }
    if (inflateReset(&inflater_) != Z_OK) throw std::bad_alloc();
    in_member_ = true;
    return true;
}

bool unpacked_bytes::inflate_some(std::string& to) {
    const size_t old_size = to.size();
    to.resize(old_size + piece_size);
    inflater_.next_out = reinterpret_cast<Bytef*>(to.data() + old_size);
    inflater_.avail_out = piece_size;
    const int result = inflate(&inflater_, Z_NO_FLUSH);
    to.resize(to.size() - inflater_.avail_out);
    if (result == Z_STREAM_END) in_member_ = false;
    if (result == Z_STREAM_END || result == Z_OK || result == Z_BUF_ERROR) return true;
    if (result == Z_MEM_ERROR) throw std::bad_alloc();
    return fail("the gzip data is damaged at " + position() + " (" +
                (inflater_.msg ? inflater_.msg : zError(result)) + ")");
}

bool unpacked_bytes::read_some(std::string& to) {
    if (!problem_.empty()) return false;
    if (!is_gzip_) {
        if (!fill()) return false;
        to.append(reinterpret_cast<const char*>(inflater_.next_in), inflater_.avail_in);
        inflater_.avail_in = 0;
        return true;
    }
    const size_t old_size = to.size();
    while (to.size() == old_size) {
        if (!in_member_ && !start_member()) return false;
        if (!fill()) {
            if (!problem_.empty()) return false;
            return fail("the gzip data is cut short at " + position());
        }
        if (!inflate_some(to)) return to.size() > old_size;
    }
    return true;
}

}  // namespace kivd
