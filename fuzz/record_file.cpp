// Mending of record files.
#include "record/record_file.h"

#include "fuzz/harness.h"

namespace kivd {
namespace {

constexpr char path[] = "private/events";
constexpr std::string_view event("\x12\x0A\x0A\x01p\x12\x01n\x18\x00\x22\x00", 12);

void check_rescue(input_bytes input, record_header header) {
    write_file(path, input);
    rescue_event_file(path, header);
    const std::string rescued = read_file(path);
    require(rescued.size() <= input.size() &&
                std::equal(rescued.begin(), rescued.end(), input.begin(),
                           [](char a, uint8_t b) { return static_cast<uint8_t>(a) == b; }),
            "what is left is not the file's beginning");

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
