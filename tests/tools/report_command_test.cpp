#include "tools/report_command.h"

#include <sstream>

#include "sample_reports.h"

namespace kivd {
namespace {

class report_command : public report_files {};

constexpr report_view views[] = {report_view::text, report_view::json, report_view::summary};

TEST_F(report_command, shows_every_file_it_can_and_tells_what_is_wrong_with_the_others) {
    const std::string records = records_of(header_text + event_text("shown"));
    const std::string good = write("kiv_1", gzip(records));
    const std::string torn = write("events", records + records_of(event_text("torn")).substr(0, 9));
    const std::string sealed = write(
        "kiv_2", records_of("header { product_id: '' software_version: '' software_variant: ''"
                            " device_id: '' } encryption_key: 'k' encryption_iv: 'i'"
                            " encrypted_compressed_data: 'secret'"));
    const std::string missing = directory / "kiv_3";

    const std::string complaints =
        "kivtool: " + missing + ": cannot be opened: No such file or directory\n" +
        "kivtool: " + torn + ": stopped at byte " + std::to_string(records.size()) +
        ": the record there is cut short: it has 9 of its 17 bytes\n" + "kivtool: " + sealed +
        ": the report is sealed, only its private report key can open it\n";

    for (const report_view view : views) {
        SCOPED_TRACE(static_cast<int>(view));
        std::ostringstream out, err;
        EXPECT_EQ(run_report_command({missing, torn, sealed, good}, view, out, err), 1);
        const std::string text = out.str();
        EXPECT_NE(text.find("shown"), text.rfind("shown")) << text;  // in both files
        EXPECT_EQ(text.find("torn"), std::string::npos) << text;
        EXPECT_EQ(err.str(), complaints);

        std::ostringstream good_err;
        EXPECT_EQ(run_report_command({good}, view, out, good_err), 0) << good_err.str();
    }
}

TEST_F(report_command, tells_when_its_output_is_lost) {
    const std::string good = write("kiv_1", records_of(header_text));
    for (const report_view view : views) {
        std::ofstream full("/dev/full");
        std::ostringstream err;
        EXPECT_EQ(run_report_command({good}, view, full, err), 1);
        EXPECT_EQ(err.str(), "kivtool: the output could not be written\n");
    }
}

}  // namespace
}  // namespace kivd
