#include "daemon/kernel/kernel_bridge.h"

#include <linux/netlink.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstring>
#include <thread>

#include "bench/daemon_process.h"
#include "kernel.pb.h"
#include "runtime/stop.h"
#include "support/scratch_directory.h"

namespace kivd {
namespace {

// In place of the kernel there is a socket of this process that sends to the bridge's port; what
// the bridge sends on comes to the socket on which the daemon's own requests arrive.
class kernel_bridge : public scratch_directory {
 protected:
    kernel_bridge() {
        EXPECT_TRUE(open_daemon_socket(daemon_));
        EXPECT_STREQ(daemon_.address.sun_path, "/mnt/kiv/kiv_cl");
        strcpy(daemon_.address.sun_path, "kiv_cl");
        EXPECT_TRUE(open_netlink_socket(netlink_));
        kernel_.reset(socket(AF_NETLINK, SOCK_RAW | SOCK_CLOEXEC, NETLINK_USERSOCK));
    }
    bool send(const std::string& text) const {
        sockaddr_nl bridge = {};
        bridge.nl_family = AF_NETLINK;
        bridge.nl_pid = static_cast<uint32_t>(getpid());
        return sendto(kernel_.get(), text.data(), text.size(), MSG_DONTWAIT,
                      reinterpret_cast<const sockaddr*>(&bridge), sizeof bridge) >= 0;
    }
    void receive(const std::string& text) {
        (void)take_log();
        while (!next_packet().empty()) {
        }
        EXPECT_TRUE(send(std::string(16, '\xff') + text));
        receive_kernel_message(netlink_.get(), daemon_);
    }

    daemon_socket daemon_;
    unique_fd netlink_;
    unique_fd kernel_;
};

// The numbers 1 to 8 with the name of the process in their midst.
std::string record(int32_t sign, const std::string& comm) {
    std::string bytes;
    for (int32_t number = 1; number <= 8; ++number) {
        const int32_t value = sign * number;
        bytes.append(reinterpret_cast<const char*>(&value), sizeof value);
        if (number == 3) bytes += comm + std::string(32 - comm.size(), '\0');
    }
    return bytes;
}

TEST_F(kernel_bridge, translates_kills_and_passes_counters_as_they_are) {
    const std::string head = "EV kernel ProcessKill ";
    receive(head + doc_example("requests.md", "hex", "process-kill-record"));
    const std::string packet = next_packet();
    EXPECT_EQ(packet, head + doc_example("requests.md", "hex", "process-kill-payload"));
    kernel::ProcessKill kill;
    ASSERT_TRUE(kill.ParseFromString(packet.substr(head.size())));
    EXPECT_EQ(kill.ShortDebugString(),
              "pid: 1 rss: 2 oom_score_adj: 3 comm: \"app\" reason: 4 nr_free_pages: 5 "
              "nr_file_pages: 6 nr_file_mapped: 7 nr_free_pages_lo: 8");
    receive(head + record(1, std::string(32, 'c')) + "more");  // a name without its NUL
    ASSERT_TRUE(kill.ParseFromString(next_packet().substr(head.size())));
    EXPECT_EQ(kill.comm(), std::string(32, 'c'));

    for (const std::string& text : {"CI pkg cnt 1"s, "CS pkg cnt -7 \0x"s, " CI  a"s}) {
        receive(text);
        EXPECT_EQ(next_packet(), text);
        EXPECT_EQ(take_log(), lines());
    }
}

TEST_F(kernel_bridge, drops_what_it_does_not_know) {
    const std::string too_large = "E kivkb: Packed size greater than unpacked size, bailing...";
    const std::pair<std::string, lines> cases[] = {
        {"", {"E kivkb: Failed to parse input."}},
        {"EV kernel", {"E kivkb: Badly formatted event - dropping."}},
        {"EV other Thing " + record(1, ""),
         {"E kivkb: translate_event [other/Thing] not supported by translated", too_large}},
        {"EV kernel ProcessKill", {"E kivkb: translate_event got a record of 0 bytes", too_large}},
        {"EV kernel ProcessKill " + record(1, "").substr(1),
         {"E kivkb: translate_event got a record of 63 bytes", too_large}},
        {"EV kernel ProcessKill " + record(-1, ""), {too_large}},
        {"EV kernel ProcessKill " + std::string(30721, 'x'),
         {"E kivkb: Too large event - dropping."}},
        {"RM 0", {}},
    };
    for (const auto& [text, expected] : cases) {
        SCOPED_TRACE(text.substr(0, 40));
        receive(text);
        EXPECT_EQ(take_log(), expected);
        const std::string passed = next_packet();  // at most the error itself
        EXPECT_TRUE(passed.empty() || passed.find("DaemonError") != std::string::npos) << passed;
    }
    for (const size_t size : {1, 15}) {  // less than the header
        EXPECT_TRUE(send(std::string(size, 'x')));
        receive_kernel_message(netlink_.get(), daemon_);
    }
    fs::remove("kiv_cl");
    receive("CI pkg cnt 1");
    EXPECT_EQ(take_log().front(), "E kivkb: Failed to pass counter data to kivd (12/-1).");
}

TEST_F(kernel_bridge, waits_for_messages_and_for_room_until_the_stop) {
    EXPECT_TRUE(stop_init());
    int queued = 0;
    while (sendto(daemon_.fd.get(), "x", 1, MSG_DONTWAIT,
                  reinterpret_cast<const sockaddr*>(&daemon_.address),
                  sizeof daemon_.address) == 1) {
        ++queued;
    }
    std::thread bridge([this] {
        while (!is_stop_requested()) (void)receive_kernel_message(netlink_.get(), daemon_);
    });
    EXPECT_TRUE(send(std::string(16, ' ') + "CI kernel count 1"));
    std::this_thread::sleep_for(std::chrono::milliseconds(200));  // longer than it waits at a time
    for (int i = 0; i < queued; ++i) EXPECT_EQ(next_packet(), "x");
    std::string packet;
    EXPECT_TRUE(wait_until([&] { return !(packet = next_packet()).empty(); }));
    EXPECT_EQ(packet, "CI kernel count 1");
    request_stop();
    bridge.join();
    EXPECT_EQ(take_log(), lines());
}

}  // namespace
}  // namespace kivd
