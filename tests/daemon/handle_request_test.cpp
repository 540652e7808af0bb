#include "daemon/request/handle_request.h"

#include "report/state_file.h"
#include "runtime/daemon_error.h"
#include "support/scratch_directory.h"

namespace kivd {
namespace {

class handle_request : public scratch_directory {
 protected:
    handle_request() {
        set_data_collection(true);
        EXPECT_EQ(socketpair(AF_UNIX, SOCK_SEQPACKET, 0, ends_), 0);
    }
    // The reply to a request from ourselves, followed by what it put into the log.
    std::string ask(std::string packet) {
        (void)take_log();
        const size_t size = packet.size();
        packet.resize(size + 65);
        std::string answer =
            packet.substr(0, kivd::handle_request(ends_[0], {packet.data(), size}, nullptr).size);
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
