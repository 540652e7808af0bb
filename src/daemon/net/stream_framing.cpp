#include "daemon/net/stream_framing.h"

#include <cstring>

#include "daemon/net/packet_buffer.h"
#include "util/numbers.h"

namespace kivd {
namespace {

constexpr char delimiters[] = " \t\r\n";

}  // namespace

stream_header parse_stream_header(const char* text) {
    if (text[0] != 'H' || text[1] != 'D') return {stream_header_status::not_a_header, 0, 0};
    const char* number = text + strcspn(text, delimiters);
    number += strspn(number, delimiters);
    const size_t digits = strcspn(number, delimiters);
    if (digits == 0) return {stream_header_status::no_length, 0, 0};
    const int32_t length = parse_saturated(number);
    if (length < 1 || static_cast<size_t>(length) > max_packet_size) {
        return {stream_header_status::bad_length, 0, 0};
    }
    constexpr size_t fixed_size = 4;  // two letters, two delimiters
    return {stream_header_status::ok, fixed_size + digits, static_cast<size_t>(length)};
}

}  // namespace kivd
