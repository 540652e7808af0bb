#include "record/gzip_file.h"

#include <fcntl.h>
#include <unistd.h>
#include <zlib.h>

#include <array>
#include <cerrno>
#include <cstring>
#include <memory>

#include "runtime/log_and_raise.h"
#include "util/file_io.h"
#include "util/releaser.h"
#include "util/unique_fd.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-fu";
constexpr size_t chunk_size = 16384;
constexpr int gzip_framing = 16;  // added to the window's bits

// The settings of deflate. Storing needs no memory to search in, and fresh memory costs a child
// more than the storing does, so it gets the least there is.
struct deflate_settings {
    int level;
    int window_bits;
    int memory_level;
};

deflate_settings settings_of(gzip_level level) {
    if (level == gzip_level::best) return {Z_BEST_COMPRESSION, MAX_WBITS, 8};
    return {Z_NO_COMPRESSION, 9, 1};
}

using unique_deflate = std::unique_ptr<z_stream, releaser<deflateEnd>>;

// Runs what `stream` has as its input through deflate, finishes when `flush` is Z_FINISH, and
// writes all that comes out.
bool deflate_chunk(z_stream& stream, int flush, int output) {
    std::array<Bytef, chunk_size> chunk;
    do {
        stream.next_out = chunk.data();
        stream.avail_out = chunk.size();
        if (deflate(&stream, flush) == Z_STREAM_ERROR) return false;
        if (!write_all(output, chunk.data(), chunk.size() - stream.avail_out)) return false;
    } while (stream.avail_out == 0);
    return true;
}

bool copy(int input, z_stream& stream, int output) {
    std::array<Bytef, chunk_size> chunk;
    for (;;) {
        const ssize_t size = read(input, chunk.data(), chunk.size());
        if (size < 0 && errno == EINTR) continue;
        if (size < 0) return false;
        stream.next_in = chunk.data();
        stream.avail_in = static_cast<uInt>(size);
        if (!deflate_chunk(stream, size > 0 ? Z_NO_FLUSH : Z_FINISH, output)) return false;
        if (size == 0) return true;
    }
}

}  // namespace

bool gzip_file(const char* source, const char* destination, gzip_level level) {
    const unique_fd input(open(source, O_RDONLY | O_CLOEXEC));
    if (!input.ok()) {
        return log_and_raise(tag, "Failed to open input file: %s", strerror(errno));
    }
    const unique_fd output = create_file(destination);
    z_stream stream = {};
    const deflate_settings settings = settings_of(level);
    if (!output.ok() ||
        deflateInit2(&stream, settings.level, Z_DEFLATED, settings.window_bits + gzip_framing,
                     settings.memory_level, Z_DEFAULT_STRATEGY) != Z_OK) {
        return log_and_raise(tag, "Failed to gzopen output file");
    }
    const unique_deflate end(&stream);
    // A bounded search for repetitions: without it, random text of two letters takes many times as
    // long, and whatever waits for this child with it.
    if (level == gzip_level::best) (void)deflateTune(&stream, 8, 32, 128, 256);
    return copy(input.get(), stream, output.get());
}

}  // namespace kivd
