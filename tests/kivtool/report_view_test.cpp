#include "kivtool/report/report_view.h"

#include <google/protobuf/util/json_util.h>

#include <sstream>

#include "kivtool/report/report_command.h"
#include "kivtool/sample_reports.h"

namespace kivd {
namespace {

using namespace std::string_literals;

class report_views : public report_files {
 protected:
    // What is shown of files, all of them sound.
    static std::string view(const std::vector<std::string>& paths, const report_options& options) {
        const auto [status, out, err] = show(paths, options);
        EXPECT_EQ(status, 0);
        EXPECT_EQ(err, "");
        return out;
    }

    std::string show_records(const std::string& records, report_format format) {
        return view({write("kiv_7", records)}, {format});
    }

    kiv::Report through_json(const std::string& records) {
        kiv::Report back;
        const std::string document = show_records(records, report_format::json);
        EXPECT_TRUE(google::protobuf::util::JsonStringToMessage(document, &back).ok()) << document;
        return back;
    }

    const google::protobuf::LogSilencer silencer;
};

TEST_F(report_views, keep_names_apart_that_are_not_utf8) {
    // clang-format off
    const std::pair<std::string, std::string> cases[] = {
        {"a", "a"},
        {"a\xff", "a\\xFF"},
        {"a\\xFF", "a\\\\xFF"},
        {"\xc0\xaf", "\\xC0\\xAF"},                    // "/" in two bytes
        {"\xed\xa0\x80", "\\xED\\xA0\\x80"},           // a surrogate
        {"\xed\x9f\xbf", "\xed\x9f\xbf"},              // the last character before them
        {"\xf4\x8f\xbf\xbf", "\xf4\x8f\xbf\xbf"},      // the last character of all
        {"\xf4\x90\x80\x80", "\\xF4\\x90\\x80\\x80"},  // and one beyond it
        {"\xe2\x82z", "\\xE2\\x82z"},                  // cut
        {"nul\0\"<&>\x1b[31m"s, "nul\0\"<&>\x1b[31m"s},
    };
    // clang-format on
    kiv::Report report = report_of(header_text);
    report.mutable_header()->add_group_id("\xff");
    for (const auto& each : cases) {
        *report.add_events() = report_of(event_text("")).events(0);
        report.mutable_events()->rbegin()->set_name(each.first);
    }
    const kiv::Report back = through_json(report.SerializeAsString());
    ASSERT_EQ(back.events_size(), std::ssize(cases));
    for (int i = 0; i < back.events_size(); ++i) EXPECT_EQ(back.events(i).name(), cases[i].second);
    EXPECT_EQ(back.header().group_id(1), "\\xFF");
}

// Whatever comes first; but a list has one place.
TEST_F(report_views, of_json_keep_every_value_and_do_without_a_header) {
    const std::string parts[] = {event_text("n", INT64_MAX, "\\000\\377 payload"),
                                 event_text("m", 5, "4444"), counter_text("n", INT64_MIN, 1),
                                 counter_text("m", 7, 8), static_text("n", "one\\ntwo")};
    std::string records;
    for (const std::string& part : parts) records += records_of(part);
    const std::string trailer =
        records_of("import_info { file_nr: 4294967295 orig_encrypted: true }");
    const std::string header = records_of(header_text);
    for (const std::string& bytes : {header + records, records + header + trailer,
                                     trailer + records + header, header, trailer + header}) {
        kiv::Report whole;
        ASSERT_TRUE(whole.ParseFromString(bytes));
        EXPECT_EQ(through_json(bytes).SerializeAsString(), whole.SerializeAsString());
    }
    EXPECT_EQ(show_records(trailer, report_format::json),
              "{\n\"import_info\": {\"file_nr\":4294967295,\"orig_encrypted\":true}\n}\n");
    const std::string two = write("two", header + header + trailer);
    const std::string err = show({two}, {report_format::json}).err;
    EXPECT_NE(err.find("JSON has room for one header"), std::string::npos) << err;
    const std::string event = records_of(parts[0]), value = records_of(parts[4]);
    const shown torn = show({write("torn", event + value + event)}, {report_format::json});
    EXPECT_EQ(torn.out, show_records(event + value, report_format::json));
    EXPECT_NE(torn.err.find("one list of events, those behind"), std::string::npos) << torn.err;
    const std::string lines = view({two}, {report_format::jsonl});
    EXPECT_NE(lines.find("\"test_id\""), lines.rfind("\"test_id\"")) << lines;
}

TEST_F(report_views, of_csv_have_a_line_a_record_and_quotes_where_they_are_needed) {
    const std::string records = records_of(
        header_text + event_text("a,\"b\"", 1262325600007, "\\n\\377\\\\") + event_text(" ", -1) +
        counter_text("c", -5, 253402300800000) + static_text("s", "=x, y"));
    std::string text = show_records(records, report_format::csv);
    const std::string file = ',' + (directory / "kiv_7").string() + '\n';
    for (size_t at = 0; (at = text.find(file)) != std::string::npos;)
        text.replace(at, file.size(), "|");
    EXPECT_EQ(text,
              "kind,time,package,name,value,payload,file\n"
              "header,,,,\"product_id: \"\"test_id\"\" software_version: \"\"test_rev\"\" "
              "software_variant: \"\"test_var\"\" device_id: \"\"2543c433\"\" timezone: -5400 "
              "group_id: \"\"field-trial\"\"\",|"
              "event,2010-01-01T06:00:00.007Z,app,\"a,\"\"b\"\"\",,\\x0A\\xFF\\\\|"
              "event,-1 ms,app,\" \",,|"
              "counter,253402300800000 ms,app,c,-5,|"
              "static,1970-01-01T00:00:00.000Z,app,s,\"=x, y\",|");
}

void expect_parts(const std::string& text, const std::vector<std::string>& parts, bool present) {
    for (const std::string& part : parts) {
        EXPECT_EQ(text.find(part) != std::string::npos, present) << part << '\n' << text;
    }
}

TEST_F(report_views, of_people_say_who_when_and_what) {
    std::string report = header_text + static_text("mode", std::string(61, 'm'));
    for (int kind = 0; kind < 12; ++kind) {
        const std::string number = std::to_string(kind);
        for (int i = 0; i <= kind; ++i) report += event_text("kind" + number, 1262325600000, "ab");
        report += counter_text("count" + number, kind, 1262329500000 - kind);
    }
    const std::string text = show_records(gzip(records_of(report)), report_format::summary);
    expect_parts(
        text,
        {"kiv_7\n", "test_id", "test_rev", "2543c433", "field-trial", "UTC-01:30",
         "1970-01-01 00:00:00 to 2010-01-01 07:05:00", "78 events, 12 counters, 1 static values",
         " compressed\n", "(10 of 12)", "  12  app kind11", "24 bytes, 2010-01-01 06:00:00",
         "  11  app count11", "  0  app count0", std::string(60, 'm') + "...\n"},
        true);
    // The two rarest events and the counters that are neither large nor recent are left out.
    expect_parts(text, {"app kind0", "app kind1 ", "app count5", "app count6", "total"}, false);
}

TEST_F(report_views, of_people_have_what_a_header_has_and_how_long_it_took) {
    const std::pair<int64_t, std::string> durations[] = {
        {59'999, "59 s"},         {60'000, "1 min"},           {3'599'000, "59 min"},
        {3'600'000, "1 h 0 min"}, {86'399'000, "23 h 59 min"}, {90'000'000, "1 d 1 h"},
    };
    for (const auto& [length_ms, text] : durations) {
        const std::string summary = show_records(
            records_of("header { product_id: 'p' software_version: 's' software_variant: 'v' "
                       "device_id: 'd' build_type: 'b' serial_number: 'n' device_imei: 'i' "
                       "CDF_id: 'c' config_checksum: 'x' timezone: 3600 group_id: ['g', 'h'] }" +
                       event_text("a", length_ms) + event_text("b", 0)),
            report_format::summary);
        const std::string facts = summary.substr(0, summary.find("  contents"));
        EXPECT_TRUE(facts.ends_with(", " + text + "\n")) << facts;
        EXPECT_NE(facts.find("  product        p\n"
                             "  software       s\n"
                             "  variant        v\n"
                             "  build type     b\n"
                             "  device id      d\n"
                             "  serial number  n\n"
                             "  IMEI           i\n"
                             "  CDF id         c\n"
                             "  groups         g, h\n"
                             "  configuration  x\n"
                             "  local time     UTC+01:00\n"),
                  std::string::npos)
            << facts;
    }
}

// Of a directory, reports only, in the order of their numbers.
TEST_F(report_views, of_several_files_end_with_the_total) {
    const auto report = [](const std::string& name, int64_t value) {
        return gzip(records_of(header_text + event_text(name, 1262325600000 + value, "ab") +
                               counter_text("c", value, value) + static_text("s", name)));
    };
    write("kiv_2", report("two", 5));
    write("kiv_10", report("ten", 9));
    write("kiv_1", report("two", 1));
    for (const char* other :
         {"kiv_", "kiv_x", "kiv_-1", "kiv_01", "kiv_1x", "kiv_disabled", "x_1"}) {
        write(other, "no report");
    }
    const std::string text = view({directory}, {report_format::summary});
    const size_t total = text.find("\ntotal of 3 files\n");
    ASSERT_NE(total, std::string::npos) << text;
    EXPECT_LT(text.find("kiv_1\n"), text.find("kiv_2\n"));
    EXPECT_LT(text.find("kiv_2\n"), text.find("kiv_10\n"));
    expect_parts(text.substr(total),
                 {"3 events, 3 counters, 3 static values", "  2  app two",
                  "4 bytes, 2010-01-01 06:00:00", "  9  app c", "  ten\n"},
                 true);
    expect_parts(text.substr(total), {"test_id", "  5  app c", "  two\n"}, false);
}

}  // namespace
}  // namespace kivd
