// What a daemon has on disk, read with nothing of its own: zlib, libcrypto and protobuf.
#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <vector>

namespace kivd {

// Events show by themselves what was sent, and have ids above 0. The diagnostics keep those of
// diag_package.
inline constexpr char plain_package[] = "p";
inline constexpr char diag_package[] = "devicemonitor.powerstat";
std::string event_request(const char* package, int id, size_t size);
std::string event_record(const char* package, int id, size_t size);

// What stands before the first torn or spoilt record; the daemon's own events don't count.
struct records {
    std::vector<int> ids;
    bool whole = true;
    bool sealed = false;
};

struct kept_data {
    std::map<int, records> reports;  // by number; sealed ones are opened
    records flushed;
    records unfinished;
    std::map<int, records> diagnostics;  // by number, as clients get them
};
// Of the current directory; report.key is two directories above.
kept_data read_kept_data();

// The last field of the record of that name in a list file, 0 when there is none.
int64_t read_value(const std::string& path, const std::string& name);

}  // namespace kivd
