// The bytes of a file or of memory, decompressed when they are gzip.
#pragma once

#include <zlib.h>

#include <array>
#include <cstdint>
#include <cstdio>
#include <string>
#include <string_view>

#include "util/unique_fd.h"

namespace kivd {

inline constexpr std::string_view gzip_magic = "\x1f\x8b";  // that gzip data starts with

// Reads one source from start to end. If it starts with the magic bytes of gzip, all its members
// are decompressed; anything else is passed through.
class unpacked_bytes {
 public:
    // A file; "-" is standard input.
    explicit unpacked_bytes(const std::string& path);
    // Bytes in memory, less than 4 GiB, that outlive this object. `place` names them in
    // problems, such as "the sealed data".
    unpacked_bytes(std::string_view bytes, const char* place);
    ~unpacked_bytes();
    unpacked_bytes(const unpacked_bytes&) = delete;
    unpacked_bytes& operator=(const unpacked_bytes&) = delete;

    // Appends at least one byte to `to`. False at the end and after a problem.
    [[nodiscard]] bool read_some(std::string& to);

    // Why there were no more bytes, as the end of a sentence; empty at a good end.
    [[nodiscard]] const std::string& problem() const { return problem_; }
    [[nodiscard]] bool is_gzip() const { return is_gzip_; }
    // The only problem is that other bytes follow the last gzip member.
    [[nodiscard]] bool has_foreign_tail() const { return has_foreign_tail_; }
    // How much of the source has been used so far.
    [[nodiscard]] uint64_t offset() const { return bytes_read_ - inflater_.avail_in; }

 private:
    void start();
    bool fill();
    bool start_member();
    bool inflate_some(std::string& to);
    bool fail(std::string problem);
    std::string position() const;

    const char* place_;
    unique_file file_;  // null when the bytes are in memory
    std::array<Bytef, 65536> input_;
    z_stream inflater_{};  // also keeps track of input that is not gzip
    uint64_t bytes_read_ = 0;
    bool is_gzip_ = false;
    bool in_member_ = false;
    bool has_foreign_tail_ = false;
    std::string problem_;
};

}  // namespace kivd
