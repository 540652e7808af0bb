// The text header of a request on the stream socket: "HD", a delimiter, the payload's length in
// decimal, a delimiter. A delimiter is one space, tab, carriage return or line feed.
#pragma once

#include <cstddef>
#include <cstdint>

namespace kivd {

enum class stream_header_status : uint8_t { ok, not_a_header, no_length, bad_length };

struct stream_header {
    stream_header_status status;
    size_t header_size;   // with its last delimiter, whether or not that has arrived
    size_t payload_size;  // 1 to 31176
};

// Reads the header at the start of `text`, which ends at its first NUL.
[[nodiscard]] stream_header parse_stream_header(const char* text);

}  // namespace kivd
