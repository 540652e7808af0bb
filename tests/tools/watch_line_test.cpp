#include "kivctl/watch_line.h"

#include <gtest/gtest.h>

#include "support/scratch_directory.h"

namespace kivd {
namespace {

using namespace std::string_literals;

TEST(watch_line, says_what_the_daemon_reads_in_a_packet) {
    const std::string hex_32 = "FF FF FF FF FF FF FF FF FF FF FF FF FF FF FF FF "s;
    const struct {
        std::string packet, line, package;
    } cases[] = {
        {doc_example("requests.md", "hex", "event-request"), "   15  EV  app start  2 bytes: 01 FF",
         "app"},
        {doc_example("requests.md", "hex", "event-request-leading-blank"),
         "   17  EV  app start  4 bytes: \" abc\"", "app"},
        {doc_example("requests.md", "hex", "counter-request"), "   16  CI  app starts  -2", "app"},
        {doc_example("requests.md", "hex", "static-data-request"),
         "   23  SD  app mode  11 bytes: \"night, auto\"", "app"},
        {doc_example("requests.md", "hex", "write-configuration-request"),
         "    6  WC  3 bytes: 12 01 00", ""},
        {"EV p n", "    6  EV  p n  0 bytes", "p"},
        {"EV p n ", "    7  EV  p n  0 bytes", "p"},
        {"EV p n\0a b"s, "   10  EV  p n  3 bytes: \"a b\"", "p"},
        {"EV p", "    4  EV  p  0 bytes", "p"},
        {"EV", "    2  EV  0 bytes", ""},
        {"\t EV\rp\n\nn\t\tx", "   12  EV  p n  2 bytes: \"\\x09x\"", "p"},
        {"SD p n a  b\0c"s, "   13  SD  p n  4 bytes: \"a  b\"", "p"},
        {"CS p n \t7 8", "   11  CS  p n  7 8", "p"},
        {"PA p n", "    6  PA  p n", "p"},
        {"RM  7\0x"s, "    7  RM  7", ""},
        {"IA\0x"s, "    4  IA", ""},
        {"IA", "    2  IA", ""},
        {"", "    0  ??  0 bytes", ""},
        {"IAA p", "    5  ??  5 bytes: \"IAA p\"", ""},
        {"\xff\0"s, "    2  ??  2 bytes: FF 00", ""},
        {"EV p n \xc3\xbc\\", "   10  EV  p n  3 bytes: \"\xc3\xbc\\\\\"", "p"},
        {"EV p n a\x1b[31m", "   13  EV  p n  6 bytes: 61 1B 5B 33 31 6D", "p"},
        {"EV p n \xc2\x9b", "    9  EV  p n  2 bytes: \"\\xC2\\x9B\"", "p"},
        {"EV \x1b[31m \x9b x", "   12  EV  \\x1B[31m \\x9B  1 bytes: \"x\"", "\x1b[31m"},
        {"SG \x1b]0;x\x07", "    9  SG  \\x1B]0;x\\x07", ""},
        {"EV p n " + std::string(120, 'x'),
         "  127  EV  p n  120 bytes: \"" + std::string(120, 'x') + '"', "p"},
        {"EV p n " + std::string(121, 'x'),
         "  128  EV  p n  121 bytes: \"" + std::string(120, 'x') + "...\"", "p"},
        {"EV p n " + std::string(32, '\xff'),
         "   39  EV  p n  32 bytes: " + hex_32 + hex_32.substr(0, 47), "p"},
        {"EV p n " + std::string(33, '\xff'),
         "   40  EV  p n  33 bytes: " + hex_32 + hex_32 + "...", "p"},
        {std::string(31'176, 'x'), "31176  ??  31176 bytes: \"" + std::string(120, 'x') + "...\"",
         ""},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(testing::PrintToString(c.packet.substr(0, 100)));
        EXPECT_EQ(describe_request(c.packet), c.line);
        EXPECT_EQ(package_of(c.packet), c.package);
    }
}

}  // namespace
}  // namespace kivd
