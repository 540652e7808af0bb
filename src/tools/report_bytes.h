// The bytes of a report file, decompressed when the file is gzip.
#pragma once

#include <zlib.h>

#include <array>
#include <cstdint>
#include <cstdio>
#include <string>

#include "util/unique_fd.h"

namespace kivd {

// Reads one file from start to end. What starts with the magic bytes of gzip is decompressed, all
// of its members end to end; anything else comes as it is.
class report_bytes {
 public:
    explicit report_bytes(const std::string& path);
    ~report_bytes();
    report_bytes(const report_bytes&) = delete;
    report_bytes& operator=(const report_bytes&) = delete;

    // Appends at least one byte to `to`, or gives false: at the end, or with a problem.
    [[nodiscard]] bool read_some(std::string& to);

    // Why there were no more bytes, as the end of a sentence; empty at a good end.
    [[nodiscard]] const std::string& problem() const { return problem_; }
    [[nodiscard]] bool is_gzip() const { return is_gzip_; }
    // How much of the file has been used so far.
    [[nodiscard]] uint64_t file_offset() const { return bytes_read_ - inflater_.avail_in; }

 private:
    bool fill();
    bool start_member();
    bool inflate_some(std::string& to);
    bool fail(std::string problem);

    unique_file file_;
    std::array<Bytef, 65536> input_;
    z_stream inflater_{};  // also says what is left of `input_` when the file is not gzip
    uint64_t bytes_read_ = 0;
    bool is_gzip_ = false;
    bool in_member_ = false;
    std::string problem_;
};

}  // namespace kivd
