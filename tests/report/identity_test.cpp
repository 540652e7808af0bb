#include "report/identity.h"

#include "bench/daemon_process.h"
#include "record/header_record.h"
#include "report.pb.h"
#include "report/report_generation.h"
#include "report/state_file.h"
#include "store/events.h"
#include "support/scratch_directory.h"
#include "util/paths.h"

namespace kivd {
namespace {

class identity : public scratch_directory {
 protected:
    // The header in force, as collectors read it.
    static kiv::Header header() {
        const auto bytes = get_report_header();
        kiv::Report report;
        EXPECT_TRUE(report.ParseFromArray(bytes.data(), static_cast<int>(bytes.size())));
        return report.header();
    }
    static std::string groups() {
        return contents({get_report_header().begin(), get_report_header().end()});
    }
};

TEST_F(identity, properties_have_substitutes_and_give_way_to_header_info) {
    properties = {{"ro.build.product_id", "P2"},
                  {"ro.build.type", "user"},
                  {"ro.qeli.version.sw_type", "eng"},
                  {"ro.qeli.version.cust", "C"},
                  {"ro.qeli.version.sw_variant", std::string(91, 'x')},
                  {"persist.sys.qeli.kivgroup", "G"}};
    update_header_info();
    EXPECT_EQ(header().build_type() + header().cdf_id() + groups(), "engCP2 G; ");
    EXPECT_EQ(header().software_variant(), std::string(63, 'x'));

    properties["ro.qeli.version.cust_revision"] = std::string(90, 'r');
    const std::string text =
        "id: first\nid: P3 ignored\n type: no\ntype:\ntimezone: -5400\ntimezone: x\n"
        "group id: A\nserial num: " +
        std::string(63, 's') + "\ndevice id: " + std::string(41, 'd') +
        "\ngroup id: " + std::string(40, 'b') + "\n" + std::string(1000, 'l') + "\nvariant: last";
    write_file(paths::header_info, text);
    update_header_info();
    EXPECT_EQ(header().build_type() + header().software_variant(), "englast");
    EXPECT_EQ(header().cdf_id(), "C_" + std::string(60, 'r'));
    EXPECT_EQ(header().serial_number(), std::string(11, 's'));
    EXPECT_EQ(header().device_id(), std::string(40, 'd'));
    EXPECT_EQ(header().timezone(), -5400);
    EXPECT_EQ(groups(), "P3 G A " + std::string(32, 'b') + "; ");
}

TEST_F(identity, group_ids_are_kept_in_order_and_across_a_restart) {
    for (const char* id : {"A", "B", "C", "B", "D", "E", "F", "G"}) set_group_id(id);
    EXPECT_EQ(groups(), "P1 B C D E F G; ");
    replace_group_id("H", "D");
    replace_group_id("I", "nobody");
    for (const char* id : {"B", "G", "G"}) delete_group_id(id);
    const std::string same(32, 'x');
    for (const char* end : {"123", "456"}) set_group_id((same + end).c_str());
    restart();
    EXPECT_EQ(groups(), "P1 C H E F " + same + "1; ");
    delete_group_id(same.c_str());
    EXPECT_EQ(groups(), "P1 C H E F; ");
}

}  // namespace
}  // namespace kivd
