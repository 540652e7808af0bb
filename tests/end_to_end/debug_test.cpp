// The debug interface on its one TCP port.
#include "debug_port.h"

namespace kivd {
namespace {

using namespace std::string_literals;
using enum socket_kind;

class debug_interface : public debug_port_test {};

std::string frame(const std::string& packet) {
    const auto size = static_cast<char>(packet.size());
    return "\0\0\0"s + static_cast<char>(size + 2) + "\x0a" + size + packet;
}

// Until there are as many bytes, or the daemon hangs up.
std::string receive(int fd, size_t size) {
    std::string all;
    while (all.size() < size) {
        const std::string more = receive_text(fd);
        if (more.empty()) break;
        all += more;
    }
    return all;
}

TEST_F(debug_interface, shows_every_request_to_its_latest_client) {
    const daemon_process daemon = start({{"-C", "-d"}});
    EXPECT_EQ(daemon.count_in_log("I kivd: kivddi (kivd debug interface) Enabled."), 1U);
    const unique_fd first = connect_debugger();
    request({"EV p e x"});  // by now it has been accepted
    const unique_fd second = connect_debugger();
    (void)receive(first.get(), SIZE_MAX);
    char byte = 0;
    EXPECT_EQ(recv(first.get(), &byte, 1, MSG_DONTWAIT), 0);  // hung up

    const unique_fd client = connect_client(stream);
    EXPECT_EQ(ask(client.get(), "HD 2 IA"), "1");
    EXPECT_TRUE(send_text(connect_client(datagram).get(), "EV p \xff \0y"s));
    const std::string expected = frame("IA") + frame("EV p \xff \0y"s);
    EXPECT_EQ(receive(second.get(), expected.size()), expected);
    EXPECT_TRUE(send_text(second.get(), "RM 0 and more than ten bytes"));  // not a request
    EXPECT_TRUE(send_text(client.get(), "HD 2 XX"));
    EXPECT_TRUE(receive(second.get(), 8).starts_with(frame("XX")));
}

TEST_F(debug_interface, a_taken_port_prevents_the_start) {
    const daemon_process daemon = start({{"-d"}});
    std::filesystem::create_directory("other");
    daemon_process other = daemon_process(
        KIVD_PATH, {{"-D", "-d", "-b", directory + "/other", "-c", "NO_ENCRYPTION"}});
    EXPECT_EQ(other.wait_exit(), 1);
    EXPECT_EQ(other.count_in_log("E kivd-kivddi: Cannot bind to di-socket - port already used? "),
              1U);
}

}  // namespace
}  // namespace kivd
