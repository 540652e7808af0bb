// Feeds a fuzz target every file of the directories given: the committed corpus, as a test.
#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <vector>

#include "fuzz/harness.h"

int main(int argc, char** argv) {
    std::vector<std::filesystem::path> files;
    for (const char* directory : std::span(argv, static_cast<size_t>(argc)).subspan(1)) {
        std::ranges::copy(std::filesystem::directory_iterator(directory),
                          std::back_inserter(files));
    }
    if (files.empty()) {
        fprintf(stderr, "no files to replay\n");
        return 1;
    }
    LLVMFuzzerInitialize(&argc, &argv);
    for (const auto& path : files) {
        std::ifstream file(path, std::ios::binary);
        const std::vector<char> bytes{std::istreambuf_iterator<char>(file), {}};
        printf("%s: %zu bytes\n", path.c_str(), bytes.size());
        fflush(stdout);  // it tells which file it was, should this one end the process
        // A copy of just that size, so that a sanitizer sees any byte read behind it.
        const std::vector<uint8_t> input(bytes.begin(), bytes.end());
        LLVMFuzzerTestOneInput(input.data(), input.size());
    }
    return 0;
}
