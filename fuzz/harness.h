// What the fuzz targets share: a working directory of their own, the daemon's modules started anew
// for every input, and a way to say what has to hold. Targets run in that directory, so paths on
// the command line have to be absolute.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>

// What libFuzzer calls, and replay_main.cpp in its place.
extern "C" {
int LLVMFuzzerInitialize(int* argc, char*** argv);
int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size);
}

namespace kivd {

using input_bytes = std::span<const uint8_t>;

// Takes the first byte off the input, by which a target chooses between cases; 0 from an empty one.
[[nodiscard]] uint8_t take_choice(input_bytes& input);

// Ends the process as a crash does, having said what went wrong, unless `holds`.
void require(bool holds, const char* what_went_wrong);

// Empties private/, output/ and input/.
void clear_files();

void write_file(const char* path, input_bytes bytes);
[[nodiscard]] std::string read_file(const char* path);  // empty when it is missing
[[nodiscard]] bool exists(const char* path);

// From now on the flood guard lets no daemon error through: each would cost a connection.
void suppress_errors();

// The daemon's modules as after a start on the files that are there, but for collection, which is
// on, and daemon errors, of which none is sent. In the end they are released, and as many
// descriptors have to be open as before.
class started_modules {
 public:
    started_modules();
    ~started_modules();
    started_modules(const started_modules&) = delete;
    started_modules& operator=(const started_modules&) = delete;

 private:
    int open_descriptors_;
};

}  // namespace kivd
