#include "daemon/net/stream_framing.h"

#include "format/request_words.h"
#include "util/numbers.h"

namespace kivd {

stream_header parse_stream_header(const char* text) {
    if (text[0] != 'H' || text[1] != 'D') return {stream_header_status::not_a_header, 0, 0};
    const request_word number = find_word(find_word(text).end);
    if (number.empty()) return {stream_header_status::no_length, 0, 0};
    const int32_t length = parse_saturated(number.start);
    if (length < 1 || static_cast<size_t>(length) > max_packet_size) {
        return {stream_header_status::bad_length, 0, 0};
    }
    constexpr size_t fixed_size = 4;  // two letters, two delimiters
    const auto digits = static_cast<size_t>(number.end - number.start);
    return {stream_header_status::ok, fixed_size + digits, static_cast<size_t>(length)};
}

}  // namespace kivd
