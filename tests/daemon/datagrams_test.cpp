#include "daemon/net/datagrams.h"

#include <sys/socket.h>

#include "daemon/net/delays.h"
#include "daemon/net/packet_buffer.h"
#include "report/state_file.h"
#include "support/scratch_directory.h"
#include "util/clock.h"

namespace kivd {
namespace {

class datagrams : public scratch_directory {
 protected:
    datagrams() {
        set_data_collection(true);
        EXPECT_TRUE(packet_buffers_init());
        EXPECT_EQ(socketpair(AF_UNIX, SOCK_DGRAM, 0, ends), 0);
        handler.fd = ends[0];
    }
    ~datagrams() override { packet_buffers_release(); }

    void send(std::string_view packet) const {
        EXPECT_EQ(::send(ends[1], packet.data(), packet.size(), MSG_DONTWAIT), std::ssize(packet));
    }

    int ends[2];
    event_handler handler = {receive_dgram_client, -1};
};

TEST_F(datagrams, each_is_handled_in_order_and_up_to_its_limit) {
    for (const char* packet : {"EV p e1", "", "EV p e2", "EV p e3"}) send(packet);
    receive_dgram_client(handler);
    receive_dgram_client(handler);  // nothing is there, and it doesn't wait
    send("CS p n " + std::string(max_packet_size - 8, '0') + "5");
    send("CS p n " + std::string(max_packet_size - 7, '0') + "6");
    receive_dgram_client(handler);
    EXPECT_EQ(take_log(), lines{"E kivd: Too large packet (dgram) from client " +
                                std::to_string(handler.fd) + ", dropping."});
    EXPECT_EQ(contents(next_report()), "P1; e1 ; e2 ; e3 ; n=5; ");
}

TEST_F(datagrams, are_received_one_by_one_when_there_is_a_delay) {
    set_receive_delay(20);
    for (const char* packet : {"EV p e1", "EV p e2"}) send(packet);
    const int64_t start_ms = monotonic_ms();
    receive_dgram_client(handler);
    EXPECT_GE(monotonic_ms() - start_ms, 20);
    EXPECT_EQ(contents(next_report()), "P1; e1 ; ");
}

TEST_F(datagrams, attached_descriptors_never_become_ours) {
    const int on = 1;
    EXPECT_EQ(setsockopt(handler.fd, SOL_SOCKET, SO_PASSCRED, &on, sizeof on), 0);
    alignas(cmsghdr) std::array<char, CMSG_SPACE(253 * sizeof(int))> control = {};
    char text[] = "EV p n";
    iovec piece = {text, 6};
    msghdr message = {};
    message.msg_iov = &piece;
    message.msg_iovlen = 1;
    message.msg_control = control.data();
    message.msg_controllen = control.size();
    *CMSG_FIRSTHDR(&message) = {CMSG_LEN(253 * sizeof(int)), SOL_SOCKET, SCM_RIGHTS};  // all of 0
    send("EV p n");  // opens the event file
    receive_dgram_client(handler);
    const size_t before = open_descriptors();
    for (int i = 0; i < 3; ++i) EXPECT_EQ(sendmsg(ends[1], &message, 0), 6);
    receive_dgram_client(handler);
    EXPECT_EQ(open_descriptors(), before);
    EXPECT_EQ(contents(next_report()), "P1; n ; n ; n ; n ; ");
}

}  // namespace
}  // namespace kivd
