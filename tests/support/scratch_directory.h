// Tests of modules on real files. Much of the daemon's state lives as long as its process, so each
// test runs in a process of its own, as ctest does it.
#pragma once

#include <gtest/gtest.h>
#include <sys/resource.h>

#include <filesystem>
#include <string>
#include <string_view>

#include "platform/recording_platform.h"
#include "util/unique_fd.h"

namespace kivd {

namespace fs = std::filesystem;
using namespace std::string_literals;

// The daemon's modules as after a start, in a fresh directory with private/, output/ and input/
// that is gone afterwards. The product is "P1".
class scratch_directory : public testing::Test {
 protected:
    scratch_directory();
    ~scratch_directory() override;

    void restart();
    // Makes a report and gives what is in it, decompressed.
    std::string next_report();
    // The next packet that the daemon sent to itself; empty when there is none.
    std::string next_packet();

    std::string directory;
    unique_fd receiver;  // where they come in

 private:
    int reports_ = 0;
};

// From now on no file of this process grows beyond `size` bytes: writes fail with EFBIG.
void limit_file_size(rlim_t size);

void write_file(const std::string& path, std::string_view bytes);
std::string read_file(const std::string& path);
bool exists(const std::string& path);

// How many descriptors of this process stand for the file; of all files when there is no path.
size_t open_descriptors(const std::string& path = "");

// The bytes of the example "hex NAME" in a file of docs/, or the text of "text NAME".
std::string doc_example(const std::string& file, const std::string& kind, const std::string& name);

// The names and values in a report: "P1 group; event payload; counter=5; static: value; ".
std::string contents(const std::string& report);

}  // namespace kivd
