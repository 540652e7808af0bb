// Reading a report file record by record, so that what is wrong with it can be said and located.
// A record is one field of kiv.Report: a key byte, the length, the content.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

#include "report.pb.h"

namespace kivd {

// How much of a file is taken in before reading stops, since a small gzip file can stand for any
// amount of data.
struct reading_limits {
    uint64_t data_size = uint64_t{1} << 30;  // bytes, decompressed
    size_t memory_size = size_t{256} << 20;  // bytes that the decoded records take
    size_t message_size = size_t{1} << 20;   // bytes of one record; keys and ciphertext excepted
};

struct report_file {
    kiv::Report report;   // of all whole records; its header may be missing
    std::string problem;  // why reading stopped, as the end of a sentence; empty at a good end
    bool is_gzip = false;
    uint64_t file_size = 0;  // bytes of the file that were used
    uint64_t data_size = 0;  // bytes of all whole records
};

[[nodiscard]] report_file read_report(const std::string& path, const reading_limits& limits = {});

// The same for the content of a file, less than 4 GiB. `place` is what problems call it, such as
// "the sealed data".
[[nodiscard]] report_file read_report_bytes(std::string_view content, const char* place,
                                            const reading_limits& limits = {});

}  // namespace kivd
