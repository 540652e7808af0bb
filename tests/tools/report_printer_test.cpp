#include "tools/report_printer.h"

#include <google/protobuf/util/json_util.h>

#include <set>
#include <sstream>

#include "sample_reports.h"
#include "tools/report_summary.h"

namespace kivd {
namespace {

using namespace std::string_literals;

std::string json_of(const kiv::Report& report) {
    std::ostringstream out;
    print_json(out, report);
    return out.str();
}

kiv::Report through_json(const kiv::Report& report) {
    kiv::Report back;
    EXPECT_TRUE(google::protobuf::util::JsonStringToMessage(json_of(report), &back).ok());
    return back;
}

TEST(report_json, keeps_names_apart_that_are_not_utf8) {
    const google::protobuf::LogSilencer silencer;
    // clang-format off
    const struct {
        std::string name, shown;
    } cases[] = {
        {"a", "a"},
        {"a\xff", "a\\xFF"},
        {"a\xfe", "a\\xFE"},
        {"a\\xFF", "a\\\\xFF"},
        {"a\\\\xFF", "a\\\\\\\\xFF"},
        {"\xffz", "\\xFFz"},
        {"\x80", "\\x80"},
        {"\xc0\xaf", "\\xC0\\xAF"},                    // "/" in two bytes
        {"\xe0\x80\xaf", "\\xE0\\x80\\xAF"},           // in three
        {"\xf0\x80\x80\xaf", "\\xF0\\x80\\x80\\xAF"},  // and in four
        {"\xed\xa0\x80", "\\xED\\xA0\\x80"},           // a surrogate
        {"\xed\x9f\xbf", "\xed\x9f\xbf"},              // the last character before them
        {"\xf4\x8f\xbf\xbf", "\xf4\x8f\xbf\xbf"},      // the last character of all
        {"\xf4\x90\x80\x80", "\\xF4\\x90\\x80\\x80"},  // and one beyond it
        {"\xe2\x82", "\\xE2\\x82"},                    // cut
        {"\xe2\x82z", "\\xE2\\x82z"},
        {"\xe2\x82\xac \xc3\xa9 \xf0\x9f\x98\x80", "\xe2\x82\xac \xc3\xa9 \xf0\x9f\x98\x80"},
        {"nul\0"s + "nul", "nul\0"s + "nul"},
        {"\x1b[31m\"<&>", "\x1b[31m\"<&>"},
    };
    // clang-format on
    kiv::Report report = report_of(header_text);
    report.mutable_header()->add_group_id("\xff");
    for (const auto& name : cases) {
        *report.add_events() = report_of(event_text("")).events(0);
        report.mutable_events()->rbegin()->set_name(name.name);
    }
    const kiv::Report back = through_json(report);

    ASSERT_EQ(back.events_size(), std::ssize(cases));
    std::set<std::string> names;
    for (int i = 0; i < back.events_size(); ++i) {
        EXPECT_EQ(back.events(i).name(), cases[i].shown);
        EXPECT_TRUE(names.insert(back.events(i).name()).second) << cases[i].shown;
    }
    EXPECT_EQ(back.header().group_id(1), "\\xFF");
}

TEST(report_json, keeps_every_value_and_does_without_a_header) {
    const std::string parts = event_text("n", INT64_MAX, "\\000\\377 payload") +
                              counter_text("n", INT64_MIN, 1) + static_text("n", "one\\ntwo");
    const kiv::Report whole = report_of(header_text + parts);
    EXPECT_EQ(through_json(whole).SerializeAsString(), whole.SerializeAsString());
    const std::string headless = json_of(report_of(parts));
    EXPECT_NE(headless.find("-9223372036854775808"), std::string::npos) << headless;
}

TEST(report_text, can_be_encoded_again) {
    const google::protobuf::LogSilencer silencer;
    const kiv::Report report = report_of(header_text + event_text("n\\377", 1, "\\000\\n\\376"));
    std::ostringstream out;
    print_text(out, "a\nfile", report);
    EXPECT_EQ(out.str().substr(0, out.str().find('\n')), "# a\\x0Afile");
    EXPECT_EQ(records_of(out.str()), report.SerializeAsString());
}

std::string summary_of(const std::string& report_text) {
    report_file file{.report = report_of(report_text), .problem = "", .is_gzip = true};
    file.file_size = 99;
    std::ostringstream out;
    print_summary(out, "kiv_7", file);
    return out.str();
}

void expect_parts(const std::string& text, const std::vector<std::string>& parts, bool present) {
    for (const std::string& part : parts) {
        EXPECT_EQ(text.find(part) != std::string::npos, present) << part << '\n' << text;
    }
}

TEST(report_summary, says_who_when_and_what) {
    std::string report = header_text + static_text("mode", std::string(61, 'm'));
    for (int kind = 0; kind < 12; ++kind) {
        const std::string number = std::to_string(kind);
        for (int i = 0; i <= kind; ++i) report += event_text("kind" + number, 1262325600000, "ab");
        report += counter_text("count" + number, kind, 1262329500000 - kind);
    }
    const std::string text = summary_of(report);
    expect_parts(
        text,
        {"kiv_7\n", "test_id", "test_rev", "2543c433", "field-trial", "UTC-01:30",
         "1970-01-01 00:00:00 to 2010-01-01 07:05:00", "78 events, 12 counters, 1 static values",
         ", 99 compressed\n", "(10 of 12)", "  12  app kind11", "24 bytes, 2010-01-01 06:00:00",
         "  11  app count11", "  0  app count0", std::string(60, 'm') + "...\n"},
        true);
    // The two rarest events and the counters that are neither large nor recent are left out.
    expect_parts(text, {"app kind0", "app kind1 ", "app count5", "app count6"}, false);
}

}  // namespace
}  // namespace kivd
