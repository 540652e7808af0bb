// Mending of record files.
#include "report/record_file.h"

#include "fuzz/harness.h"

namespace kivd {
namespace {

constexpr char path[] = "private/events";

void check_rescue(input_bytes input, record_header header) {
    write_file(path, input);
    rescue_event_file(path, header);
    const std::string rescued = read_file(path);
    require(rescued.size() <= input.size() &&
                std::equal(rescued.begin(), rescued.end(), input.begin(),
                           [](char a, uint8_t b) { return static_cast<uint8_t>(a) == b; }),
            "what is left is not the file's beginning");

    // Once more: a record of fewer than 6 bytes counts as torn when it is the last one. The daemon
    // writes none that short.
    rescue_event_file(path, header);
    require(rescued.size() - read_file(path).size() < 6 && (exists(path) || rescued.size() < 6),
            "a mended file is mended once more");
}

}  // namespace
}  // namespace kivd

int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    kivd::clear_files();
    kivd::reset_state();
    kivd::check_rescue({data, size}, kivd::record_header::absent);
    kivd::check_rescue({data, size}, kivd::record_header::expected);
    return 0;
}
