// Mending of record files.
#include "record/record_file.h"

#include "fuzz/harness.h"

namespace kivd {
namespace {

constexpr char path[] = "private/events";
constexpr std::string_view event("\x12\x0A\x0A\x01p\x12\x01n\x18\x00\x22\x00", 12);

// Where the whole records of a file end, by the rule that its readers follow: a key, a length of at
// most 31 bits, as many bytes.
size_t end_of_records(input_bytes bytes, uint8_t key) {
    size_t end = 0;
    while (end < bytes.size() && bytes[end] == key) {
        uint64_t length = 0;
        size_t at = end + 1;
        for (int shift = 0;; shift += 7) {
            if (at == bytes.size() || shift > 28) return end;
            length |= uint64_t{bytes[at] & 0x7FU} << shift;
            if ((bytes[at++] & 0x80U) == 0) break;
        }
        length &= UINT32_MAX;
        if (length > INT32_MAX || length > bytes.size() - at) return end;
        end = at + length;
        key = 0x12;  // behind a header there are events
    }
    return end;
}

void check_rescue(input_bytes input, record_header header) {
    write_file(path, input);
    rescue_event_file(path, header);
    const std::string rescued = read_file(path);
    require(rescued.size() <= input.size() &&
                std::equal(rescued.begin(), rescued.end(), input.begin(),
                           [](char a, uint8_t b) { return static_cast<uint8_t>(a) == b; }),
            "what is left is not the file's beginning");

    // Records of fewer than 6 bytes in all hold nothing, and may be taken for torn ones.
    const uint8_t key = header == record_header::expected ? 0x0A : 0x12;
    const size_t whole = end_of_records(input, key);
    require(rescued.size() <= whole && whole - rescued.size() < 6,
            "not all whole records are left");

    // What it is for: that the next events can be appended, and are found at the next start.
    if (!exists(path)) return;
    const std::string appended = rescued + std::string(event);
    write_file(path, {reinterpret_cast<const uint8_t*>(appended.data()), appended.size()});
    rescue_event_file(path, header);
    require(read_file(path) == appended, "an event behind a mended file is lost");
}

}  // namespace
}  // namespace kivd

int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    kivd::clear_files();
    kivd::suppress_errors();
    kivd::check_rescue({data, size}, kivd::record_header::absent);
    kivd::check_rescue({data, size}, kivd::record_header::expected);
    return 0;
}
