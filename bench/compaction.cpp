// Compressing a report's data against zlib's own time for the same bytes.
#include <zlib.h>

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <random>

#include "bench/load.h"
#include "bench/measure.h"
#include "bench/plain_file.h"
#include "bench/sections.h"
#include "format/record_format.h"
#include "record/gzip_file.h"

namespace kivd::bench {

namespace {

constexpr size_t report_size = 400'000;
constexpr int64_t first_timestamp_ms = 1'700'000'000'000;
constexpr int gzip_window_bits = 15 + 16;
constexpr int default_memory_level = 8;

// A payload as applications write them: some words of text, some numbers.
std::string make_payload(std::mt19937& random) {
    static constexpr const char* screens[] = {"main", "settings", "camera", "contacts", "music"};
    static constexpr const char* actions[] = {"open", "close", "scroll", "tap", "rotate", "share"};
    char text[256];
    (void)snprintf(text, sizeof text,
                   "screen=%s;action=%s;duration_us=%u;battery_mv=%u;session=%08x%08x;free_kb=%u",
                   screens[random() % 5], actions[random() % 6],
                   static_cast<unsigned>(random() % 3'000'000),
                   static_cast<unsigned>(3300 + random() % 900), static_cast<unsigned>(random()),
                   static_cast<unsigned>(random()), static_cast<unsigned>(random() % 900'000));
    return text;
}

// One that takes zlib long: its search finds something everywhere.
std::string make_letters(std::mt19937& random) {
    std::string text(1000, 'a');
    for (char& letter : text) letter = static_cast<char>('a' + (random() & 1U));
    return text;
}

std::string make_report(std::string (*make)(std::mt19937&)) {
    static constexpr const char* names[] = {"button_pressed", "screen_shown", "battery_level"};
    std::mt19937 random(1);
    std::string report;
    int64_t timestamp = first_timestamp_ms;
    while (report.size() < report_size) {
        const std::string payload = make(random);
        uint8_t head[356];
        timestamp += static_cast<int64_t>(random() % 5000);
        const size_t size = pack_event_record(head, "com.example.app", names[random() % 3],
                                              timestamp, payload.size());
        report.append(reinterpret_cast<const char*>(head), size);
        report += payload;
    }
    return report;
}

void read_file(const std::string& path, std::vector<Bytef>& into) {
    FILE* const file = fopen(path.c_str(), "rbe");
    if (file == nullptr) give_up("%s: %s", path.c_str(), strerror(errno));
    if (fread(into.data(), 1, into.size(), file) != into.size())
        give_up("%s: cannot be read", path.c_str());
    (void)fclose(file);
}

// Buffers for a whole report, used again and again so that no round pays for fresh memory.
struct buffers {
    std::vector<Bytef> plain;
    std::vector<Bytef> packed;
};

// The whole file at once, one call of deflate with the settings that gzip files have.
size_t compress_at_once(const std::string& source, const std::string& destination, int level,
                        buffers& use) {
    read_file(source, use.plain);
    z_stream stream{};
    (void)deflateInit2(&stream, level, Z_DEFLATED, gzip_window_bits, default_memory_level,
                       Z_DEFAULT_STRATEGY);
    use.packed.resize(deflateBound(&stream, use.plain.size()));
    stream.next_in = use.plain.data();
    stream.avail_in = static_cast<uInt>(use.plain.size());
    stream.next_out = use.packed.data();
    stream.avail_out = static_cast<uInt>(use.packed.size());
    if (deflate(&stream, Z_FINISH) != Z_STREAM_END) give_up("deflate failed");
    const size_t packed_size = stream.total_out;
    (void)deflateEnd(&stream);
    write_file(destination, {reinterpret_cast<const char*>(use.packed.data()), packed_size});
    return packed_size;
}

void measure_level(const setup& s, const char* name, const std::string& report, gzip_level level,
                   int zlib_level, goal wanted) {
    const scratch_directory directory(s.scratch);
    const std::string source = directory.path() + "/report";
    const std::string ours = directory.path() + "/ours.gz";
    const std::string theirs = directory.path() + "/theirs.gz";
    write_file(source, report);

    std::vector<double> our_ms;
    std::vector<double> their_ms;
    size_t their_size = 0;
    buffers use;
    use.plain.resize(report.size());
    for (unsigned i = 0; i < amount(s, 25, 7) + 1; ++i) {
        int64_t start = now_ns();
        their_size = compress_at_once(source, theirs, zlib_level, use);
        const int64_t their_ns = now_ns() - start;
        start = now_ns();
        if (!gzip_file(source.c_str(), ours.c_str(), level)) give_up("gzip_file failed");
        const int64_t our_ns = now_ns() - start;
        if (i == 0) continue;
        our_ms.push_back(static_cast<double>(our_ns) / 1e6);
        their_ms.push_back(static_cast<double>(their_ns) / 1e6);
    }
    print_note("%s: %zu bytes become %zu, with zlib at once %zu", name, report.size(),
               size_t{std::filesystem::file_size(ours)}, their_size);
    print_row("zlib at once, reading and writing included", their_ms, "ms");
    print_row("fu_gzip_file", our_ms, "ms");
    print_row("fu_gzip_file : zlib", ratios(our_ms, their_ms), "x", wanted);
}

}  // namespace

void measure_compaction(const setup& s) {
    print_section("Compaction of a full report");
    const std::string usual = make_report(make_payload);
    constexpr goal not_slower = {bound::at_most, 1.05};
    measure_level(s, "level 9", usual, gzip_level::best, Z_BEST_COMPRESSION, not_slower);
    measure_level(s, "letters a and b, level 9", make_report(make_letters), gzip_level::best,
                  Z_BEST_COMPRESSION, not_slower);
    measure_level(s, "stored", usual, gzip_level::stored, Z_NO_COMPRESSION, {});
}

}  // namespace kivd::bench
