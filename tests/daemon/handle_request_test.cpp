#include "daemon/request/handle_request.h"

#include "report/state_file.h"
#include "runtime/daemon_error.h"
#include "store/events.h"
#include "support/scratch_directory.h"

namespace kivd {
namespace {

class handle_request : public scratch_directory {
 protected:
    handle_request() {
        set_data_collection(true);
        EXPECT_EQ(socketpair(AF_UNIX, SOCK_SEQPACKET, 0, ends_), 0);
    }
    // The reply to a request, from ourselves unless a message says else, followed by what it put
    // into the log.
    std::string ask(std::string packet, const msghdr* message = nullptr) {
        (void)take_log();
        const size_t size = packet.size();
        packet.resize(size + 65);
        std::string answer = packet.substr(
            0, kivd::handle_request({ends_[0], getuid(), message}, {packet.data(), size}).size);
        for (const std::string& line : take_log()) answer += line;
        return answer;
    }

 private:
    int ends_[2];
};

TEST_F(handle_request, values_and_payloads_are_what_follows_the_name) {
    const std::string largest(30720, 'x');
    const std::string package(200, 'p');
    const std::string name(56, 'n');
    for (const std::string& packet :
         {"EV p e1"s, "EV p e2 "s, "EV p e3  \0x \n"s, "\t EV\r\np\te4\ngo on"s, "EV p e5\0x"s,
          "EV p e6 " + largest, "EV " + package + " " + name, "CS p c 7"s, "CI p c -9x"s,
          "CI p d 99999999999"s, "CI p z none"s, "SD p s  night\t \0day"s, "SD p t a"s}) {
        EXPECT_EQ(ask(packet), "") << packet;
    }
    EXPECT_EQ(contents(next_report()), "P1; e1 ; e2 ; e3  \0x \n; e4 go on; e5 x; e6 "s + largest +
                                           "; " + name +
                                           " ; c=-2; d=2147483647; z=0; s:  night\t ; t: a; ");
}

TEST_F(handle_request, what_is_refused_becomes_an_event_and_a_count) {
    (void)ask("XY z");
    EXPECT_EQ(next_packet(), "EV kiv DaemonError " + doc_example("log.md", "hex", "daemon-error"));
    EXPECT_EQ(next_packet(), "CI kiv Cnt_DaemonError 1");
    set_error_nr(99);
    (void)ask("");
    EXPECT_TRUE(next_packet().ends_with(doc_example("log.md", "hex", "daemon-error-flooding")));
    EXPECT_EQ(next_packet(), "CI kiv Cnt_DaemonError 1");
    const std::string none = "E kivd: Invalid command: none - dropping.";
    EXPECT_TRUE(ask("").starts_with(none + "E kivd-error: KIV daemon error event will not be"));
    EXPECT_EQ(ask(""), none);  // told once
    EXPECT_EQ(next_packet(), "");
}

TEST_F(handle_request, each_is_answered_or_told_in_the_log) {
    const std::string none = "Invalid command: none - dropping.", n57(57, 'n'), p200(200, 'p');
    const std::string too_long = "To large probe id, 257 > 256 - dropping. [";
    const std::pair<std::string, std::string> cases[] = {
        {"\0IA"s, none},
        {" \t\r\n", none},
        {"E\0V a b"s, "Bad command: 69/0 - dropping"},
        {"E", "Bad command: 69/0 - dropping"},
        {"EVX a b", "Bad command: 69/86 - dropping"},
        {"\xff\x80 x", "Bad command: 255/128 - dropping"},
        {"EV", "[EV] Null in probe id - dropping. [null:null]"},
        {"CS %n%s", "[CS] Null in probe id - dropping. [%n%s:null]"},
        {"CI p n ", "[CI] Null in probe value - dropping. [p:n]"},
        {"SD p n \0v"s, "[SD] Null in probe value - dropping. [p:n]"},
        {"PA p", "[PA] Null in probe id - dropping. [p:null]"},
        {"GC " + p200 + " " + n57, "[GC] " + too_long + p200 + ":" + n57 + "]"},
        {"EV p n " + std::string(30721, 'x'), "Too large event - dropping. [p:n] 30721 bytes"},
        {"DC", "Enable/disable data collection without value."},
        {"RM ", "Remove report without number."},
        {"SN", "set_serial_number without value."},
        {"IM", "set_imei without value."},
        {"SG", "set_group_id without value."},
        {"DG ", "delete_group_id without value."},
        {"RG n", "replace_group_id without valid value."},
        {"WC", "Badly formatted packet (WC) - dropping."},
    };
    for (const auto& [packet, expected] : cases) {
        EXPECT_EQ(ask(packet), "E kivd: " + expected) << packet.substr(0, 20);
    }
    const std::pair<std::string, std::string> answered[] = {
        {"IA" + std::string(31000, ' '), "1"},
        {"PA %n ..", "1"},
        {"PA a b c d e", "1"},
        {"GC ../../etc passwd", "FAIL"},
        {"FG 750 99999999999", "FAIL"},
        {"FG 750", "FAILE kivd: Badly formatted packet (FG) - dropping."},
        {"FN 99999999999 x", "-1"},
        {"FN ", "-E kivd-fu: File iterator next, null parameters found."},  // cut to the packet
        {"RM -1", "W kivd-util: Failed to delete output/kiv_-1 : No such file or directory"},
        {"NC", "0"},
    };
    for (const auto& [packet, expected] : answered) EXPECT_EQ(ask(packet), expected) << packet;
}

TEST_F(handle_request, who_has_no_permission_is_refused) {
    const msghdr from_nobody = {};
    const std::pair<const char*, const char*> cases[] = {
        {"FL", "W kivd: flush (FL)"},
        {"FS", "W kivd: forceSave (FS)"},
        {"WC x", "W kivd: writeConfiguration (WC)"},
        {"NC", "0W kivd: notifyNewConfiguration (NC)"},
        {"FN 750 0", "-1W kivd: fileIteratorNext (FN)"},
        {"FG 750 1", "FAILW kivd: fileGet (FG)"},
        {"GD", "W kivd: getDeviceId (GD)"},
        {"DC 0", "W kivd: setDataCollectionEnable (DC)"},
        {"RM 0", "W kivd: removeReport (RM)"},
        {"SN 1", "W kivd: setSerialNumber (SN)"},
        {"IM 1", "W kivd: setImei (IM)"},
    };
    write_file("output/kiv_1", "");
    EXPECT_EQ(ask("EV p n", &from_nobody) + ask("CI p n 1", &from_nobody), "");
    for (const auto& [packet, refusal] : cases) {
        EXPECT_EQ(ask(packet, &from_nobody), refusal + " request denied due to permission!"s);
    }
    EXPECT_FALSE(exists("private/counters.txt") || exists("input/config"));
    EXPECT_TRUE(events_pending() && exists("output/kiv_1") && is_data_collection_enabled());
}

TEST_F(handle_request, without_data_collection_data_is_dropped_in_silence) {
    EXPECT_EQ(ask("DC none"), "");
    for (const char* packet : {"EV p n", "CS p", "CI p n 1", "SD p n v", "FL"}) {
        EXPECT_EQ(ask(packet), "");
    }
    EXPECT_FALSE(exists("private/events"));
    EXPECT_NE(read_file("private/kivd.state").find("data-collection: 0\n"), std::string::npos);
    EXPECT_EQ(ask("DC -1"), "");
    EXPECT_EQ(ask("EV p n"), "");
    EXPECT_TRUE(exists("private/events"));
}

}  // namespace
}  // namespace kivd
