#include "diag/gzip_file.h"

#include <zlib.h>

#include <array>
#include <cerrno>
#include <cstdio>
#include <cstring>

#include "daemon/error/log_and_raise.h"
#include "util/file_io.h"
#include "util/unique_fd.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-fu";
constexpr size_t chunk_size = 2048;

using unique_gzip = std::unique_ptr<gzFile_s, releaser<gzclose>>;

bool copy(FILE* source, gzFile destination) {
    std::array<char, chunk_size> chunk;
    for (;;) {
        const size_t size = fread(chunk.data(), 1, chunk.size(), source);
        if (size == 0) break;
        if (gzwrite(destination, chunk.data(), static_cast<unsigned>(size)) !=
            static_cast<int>(size)) {
            return false;
        }
    }
    // On a full device every gzwrite may have succeeded; the end of the stream tells.
    return ferror(source) == 0 && gzflush(destination, Z_FINISH) == Z_OK;
}

}  // namespace

int fu_gzip_file(const char* source, const char* destination, gzip_level level) {
    const unique_file input = open_to_read(source);
    if (!input) {
        (void)log_and_raise(tag, "Failed to open input file: %s", strerror(errno));
        return 0;
    }
    const unique_gzip output(gzopen(destination, level == gzip_level::best ? "wb9e" : "wb0e"));
    if (!output) {
        (void)log_and_raise(tag, "Failed to gzopen output file");
        return 0;
    }
    return copy(input.get(), output.get()) ? 1 : 0;
}

}  // namespace kivd
