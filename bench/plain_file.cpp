#include "bench/plain_file.h"

#include <cerrno>
#include <cstring>
#include <fstream>
#include <iterator>

#include "bench/measure.h"
#include "util/file_io.h"

namespace kivd::bench {

void write_file(const std::string& path, std::string_view bytes) {
    const unique_fd file = create_file(path.c_str());
    if (!file.ok() || !write_all(file.get(), bytes.data(), bytes.size()))
        give_up("%s: %s", path.c_str(), strerror(errno));
}

std::string read_file(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

}  // namespace kivd::bench
