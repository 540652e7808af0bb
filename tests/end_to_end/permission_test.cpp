// Who may make the daemon act. Only root can take on other user ids to test it.
#include <fcntl.h>
#include <grp.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/socket.h>
#include <sys/wait.h>

#include "daemon_test.h"

namespace kivd {
namespace {

using enum socket_kind;

constexpr uid_t stranger = 65534;
constexpr uid_t other_stranger = 65533;

// Sends the requests on a socket of that kind as somebody else, and an IA behind them where there
// are replies. Gives all replies in one text.
std::string ask_as(uid_t uid, socket_kind kind, const std::vector<std::string>& requests) {
    int ends[2];
    EXPECT_EQ(pipe2(ends, O_CLOEXEC), 0);
    const unique_fd output(ends[0]);
    const pid_t child = fork();
    if (child == 0) {
        if (setgroups(0, nullptr) != 0 || setgid(uid) != 0 || setuid(uid) != 0) _exit(1);
        const unique_fd client = connect_client(kind);
        for (const std::string& each : requests) {
            if (!send_text(client.get(), kind == stream ? framed(each) : each)) _exit(1);
            if (!wait_taken(client.get())) _exit(1);
        }
        std::string replies;
        if (kind != datagram) {
            (void)send_text(client.get(), kind == stream ? framed("IA") : "IA");
            (void)shutdown(client.get(), SHUT_WR);
            for (size_t before = 1; before != replies.size();) {  // until the daemon hangs up too
                before = replies.size();
                replies += receive_text(client.get());
            }
        }
        _exit(write(ends[1], replies.data(), replies.size()) < 0 ? 1 : 0);
    }
    close(ends[1]);
    std::string replies(256, '\0');
    const ssize_t size = read(output.get(), replies.data(), replies.size());
    replies.resize(static_cast<size_t>(std::max<ssize_t>(size, 0)));
    int status = -1;
    EXPECT_EQ(waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
    return replies;
}

class permission : public daemon_test {
 protected:
    void SetUp() override {
        if (getuid() != 0) GTEST_SKIP() << "only root can be somebody else";
    }
};

// Datagrams and connections know their senders in different ways.
TEST_F(permission, own_user_and_root_are_obeyed_on_every_socket) {
    const auto is_saved = [](const char* text) {
        return [text] { return read_file("private/kivd.state").find(text) != std::string::npos; };
    };
    ASSERT_EQ(chown(".", stranger, stranger), 0);
    const daemon_process daemon = start({{"-C"}, 0, stranger});
    for (const uid_t caller : {uid_t{0}, stranger}) {
        for (const socket_kind kind : {datagram, packets, stream}) {
            SCOPED_TRACE(testing::Message() << caller << " " << static_cast<int>(kind));
            EXPECT_EQ(ask_as(caller, kind, {"GD"}).size(), kind == datagram ? 0U : 37U);
            (void)ask_as(caller, kind, {"EV p event x", "CI p counter 1", "FL", "FS", "DC 0"});
            ASSERT_TRUE(wait_until(is_saved("data-collection: 0")));
            (void)wait_report(1);
            EXPECT_TRUE(std::filesystem::remove("private/counters.txt"));
            (void)ask_as(caller, kind, {"RM 1", "DC 1"});
            ASSERT_TRUE(wait_until(is_saved("data-collection: 1")));
            EXPECT_FALSE(exists("output/kiv_1"));
        }
    }
    EXPECT_EQ(daemon.count_in_log("denied"), 0U);
}

// In a mount namespace of its own, in which the group exists.
TEST_F(permission, members_of_the_private_group_are_obeyed) {
    write_file("group", "nogroup:x:65534:\nkiv_private:x:64001:nobody\n");
    std::filesystem::permissions("group", std::filesystem::perms(0644));
    if (unshare(CLONE_NEWNS) != 0 ||
        mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr) != 0 ||
        mount("group", "/etc/group", nullptr, MS_BIND, nullptr) != 0) {
        GTEST_SKIP() << "cannot have mounts of its own";
    }
    const daemon_process daemon = start();
    EXPECT_EQ(ask_as(stranger, packets, {"GD"}).size(), 37U);
    EXPECT_EQ(ask_as(other_stranger, packets, {"GD"}), "1");
    EXPECT_EQ(umount2("/etc/group", MNT_DETACH), 0);
}

}  // namespace
}  // namespace kivd
