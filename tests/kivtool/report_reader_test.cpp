#include "kivtool/report/report_reader.h"

#include <filesystem>
#include <vector>

#include "kivtool/sample_reports.h"

namespace kivd {
namespace {

using namespace std::string_literals;

class reading_reports : public report_files {};

const std::vector<std::string> sample_records = {
    records_of(header_text), records_of(event_text("first", 1, "payload")),
    records_of(event_text("empty")), records_of(counter_text("count", -1, 2)),
    records_of(static_text("text", std::string(200, 'v')))};

std::string sample() {
    std::string all;
    for (const std::string& record : sample_records) all += record;
    return all;
}

// All that a reader gives.
struct report_file {
    kiv::Report report;
    std::string problem;
    uint64_t data_size;
};

report_file read_report(const std::string& path, const reading_limits& limits = {}) {
    report_reader reader(path, nullptr, limits);
    report_file file;
    std::string records;
    while (const report_record* record = reader.next()) records += record->bytes;
    EXPECT_TRUE(file.report.ParsePartialFromString(records));
    file.problem = reader.problem();
    file.data_size = reader.data_size();
    return file;
}

int records_in(const kiv::Report& report) {
    return report.has_header() + report.events_size() + report.counters_size() +
           report.statics_size();
}

bool says(const report_file& file, const std::string& text) {
    return file.problem.find(text) != std::string::npos;
}

TEST_F(reading_reports, a_cut_gzip_file_gives_what_it_holds_and_says_so) {
    const std::string packed = gzip(sample(), 0);  // stored, so that a cut costs only what it cuts
    for (const size_t size : {size_t{2}, packed.size() / 2, packed.size() - 1}) {
        const report_file file = read_report(write("kiv_1", packed.substr(0, size)));
        EXPECT_TRUE(says(file, "the gzip data is cut short at byte " + std::to_string(size)));
        EXPECT_EQ(records_in(file.report) == 5, size == packed.size() - 1);  // only the checksum
        EXPECT_EQ(read_report(write("events", sample().substr(0, file.data_size + 1))).data_size,
                  file.data_size);
    }
    EXPECT_EQ(read_report(write("events", "")).problem, "the file is empty");
    EXPECT_EQ(read_report(write("kiv_1", gzip(""))).problem, "the gzip data is empty");
}

TEST_F(reading_reports, spoilt_bytes_end_the_reading_where_they_start) {
    const std::string good = sample();
    const struct {
        const char* what;
        std::string bytes;
        const char* problem;
    } cases[] = {
        {"text", "garbage", "no record starts with the byte 0x67"},
        {"header as a number", "\x08\x01", "no record starts with the byte 0x08"},
        {"key of two bytes", "\x92\x01\x01x", "no record starts with the byte 0x92"},
        {"endless length", "\x12\xff\xff\xff\xff\xff\x01", "no valid length"},
        {"length of 4 GiB", "\x12\xff\xff\xff\xff\x0f" + good, "claims a length of 4294967295"},
        {"length beyond the end",
         "\x42\xff\xff\x03"
         "abc",
         "it has 7 of its 65539 bytes"},
        {"field beyond its record", "\x12\x03\x0a\x7fp", "cannot be decoded as events"},
    };
    for (const auto& spoilt : cases) {
        SCOPED_TRACE(spoilt.what);
        for (const std::string& bytes : {good + spoilt.bytes, gzip(good + spoilt.bytes)}) {
            const report_file file = read_report(write("kiv_1", bytes));
            EXPECT_EQ(records_in(file.report), 5);
            EXPECT_TRUE(says(file, spoilt.problem)) << file.problem;
            EXPECT_TRUE(says(file, "stopped at byte " + std::to_string(good.size())))
                << file.problem;
        }
    }
}

TEST_F(reading_reports, a_small_file_cannot_stand_for_any_amount_of_memory) {
    const std::string event = records_of(event_text(""));
    std::string events;
    while (events.size() < 1'000'000) events += event;
    const std::string bomb = write("kiv_1", gzip(events));
    ASSERT_LT(std::filesystem::file_size(bomb), 5000u);

    EXPECT_EQ(read_report(bomb, {.data_size = events.size()}).problem, "");
    const report_file long_one = read_report(bomb, {.data_size = events.size() - 1});
    EXPECT_TRUE(says(long_one, "holds more than")) << long_one.problem;
    EXPECT_EQ(long_one.data_size, events.size() - event.size());
    // One record with a list that grows twentyfold when it is decoded.
    std::string groups;
    while (groups.size() < 2'000'000) groups += "\x6a\0"s;
    const std::string header = write("kiv_2", gzip("\x0a\x80\x89\x7a" + groups));
    EXPECT_TRUE(says(read_report(header), "claims a length of 2000000"));
}

}  // namespace
}  // namespace kivd
