// Clients that send what they should not, or stop half-way: whatever they do, the daemon serves the
// others and holds on to nothing.
#include <fcntl.h>
#include <sys/ioctl.h>
#include <sys/socket.h>

#include <array>
#include <atomic>
#include <cstring>
#include <thread>

#include "daemon_test.h"

namespace kivd {
namespace {

using namespace std::string_literals;
using enum socket_kind;

constexpr socket_kind all_kinds[] = {datagram, packets, stream};
constexpr socket_kind connection_kinds[] = {packets, stream};

bool is_served(int client, socket_kind kind) {
    return ask(client, kind == stream ? "HD 2 IA" : "IA") == "1";
}

// All three sockets work.
void expect_service() {
    for (const socket_kind kind : connection_kinds) {
        EXPECT_TRUE(is_served(connect_client(kind).get(), kind));
    }
    static int number = 0;
    const std::string mark = "alive " + std::to_string(++number) + ";";
    EXPECT_TRUE(send_text(connect_client(datagram).get(), "EV check event " + mark));
    EXPECT_TRUE(wait_until([&] { return read_file("private/events").ends_with(mark); })) << mark;
}

class hostile : public daemon_test {
 protected:
    // Starts it and has it open what stays open from the first use on.
    void begin(const start_options& options) {
        daemon_ = start(options);
        EXPECT_TRUE(send_text(connect_client(datagram).get(), "XY"));
        EXPECT_TRUE(wait_until(
            [] { return read_file("private/events").find("Bad command") != std::string::npos; }));
        descriptors_ = daemon_.descriptors();
        anonymous_kib_ = daemon_.anonymous_kib();
    }

    // It works, and holds what it held at the beginning.
    void expect_nothing_kept() {
        expect_service();
        EXPECT_TRUE(wait_until([this] { return daemon_.descriptors() == descriptors_; }))
            << daemon_.descriptors() << " instead of " << descriptors_;
#if !defined(__SANITIZE_ADDRESS__) && !defined(__SANITIZE_THREAD__)  // they keep what is freed
        EXPECT_LT(daemon_.anonymous_kib(), anonymous_kib_ + 1024);
#endif
    }

    daemon_process daemon_;
    size_t descriptors_ = 0;
    int64_t anonymous_kib_ = 0;
};

// Each piece is sent when the daemon has read the one before it.
TEST_F(hostile, malformed_packets_are_named_and_dropped_and_the_next_one_is_served) {
    begin({{"-C"}});
    using sockets = std::vector<socket_kind>;
    const sockets whole = {datagram, packets};
    const sockets framed = {stream};
    const std::string device_id = ask(connect_client(packets).get(), "GD");
    const struct {
        sockets kinds;
        std::vector<std::string> pieces;
        const char* logged;
        std::string reply = "";
    } cases[] = {
        {whole, {"\0IA"s}, "Invalid command: none - dropping."},
        {whole, {" \t\r\n"}, "Invalid command: none - dropping."},
        {whole, {"E\0V a b"s}, "Bad command: 69/0 - dropping"},
        {whole, {"\xff\x80 x"}, "Bad command: 255/128 - dropping"},
        {whole, {"CS %n%s%x %s%n"}, "[CS] Null in probe value - dropping. [%n%s%x:%s%n]"},
        {whole, {"CS " + std::string(31000, '%')}, "[CS] Null in probe id - dropping. [%%%"},
        {whole, {"EV p n " + std::string(30721, 'x')}, "Too large event - dropping. [p:n] 30721"},
        {whole, {std::string(31176, 'X')}, "Bad command: 88/88 - dropping"},
        {whole, {std::string(31177, 'X')}, "Too large packet ("},
        {whole, {std::string(200000, 'X')}, "Too large packet ("},
        {framed, {"HD 2", " ", "I", "A"}, "", "1"},
        {framed, {"HD\t2\nIA"}, "", "1"},
        {framed, {"HD +2 IA"}, "", "1"},
        {framed, {"HD 2x IA"}, "", "1"},
        {framed, {"HD " + std::string(30000, '0') + "2 IA"}, "", "1"},
        // ends with the buffer, so that the reply starts at its last but one byte
        {framed, {"HD " + std::string(31170, '0') + "2", " GD"}, "", device_id},
        {framed, {"H"}, "Invalid packet for stream from client"},
        {framed, {"\0HD 2 IA"s}, "Invalid packet for stream from client"},
        {framed, {"HD"}, "No length marked by client"},
        {framed, {"HD "}, "No length marked by client"},
        {framed, {"HD\0 2 IA"s}, "No length marked by client"},
        {framed, {"HD -1 IA"}, "Incorrect size of packet from client"},
        {framed, {"HD 0 IA"}, "Incorrect size of packet from client"},
        {framed, {"HD 0x10 IA"}, "Incorrect size of packet from client"},
        {framed, {"HD 31177 IA"}, "Incorrect size of packet from client"},
        {framed, {"HD 99999999999999999999 IA"}, "Incorrect size of packet from client"},
        {framed, {"HD 2", "0 IA IA IA IA IA"}, "Incomplete packet for stream from client"},
        {framed, {"HD 2 IAHD 2 IA"}, "Incomplete packet for stream from client"},
        {framed, {"HD 31176 ", std::string(31168, 'X')}, "Incomplete packet for stream from"},
        {framed, {std::string(31177, 'H')}, "Too large packet (stream) from client"},
    };
    for (const auto& each : cases) {
        for (const socket_kind kind : each.kinds) {
            SCOPED_TRACE(each.pieces.front().substr(0, 40));
            const unique_fd client = connect_client(kind);
            const size_t before = daemon_.log().size();
            for (const std::string& piece : each.pieces) {
                ASSERT_TRUE(wait_taken(client.get()) && send_text(client.get(), piece));
            }
            ASSERT_TRUE(daemon_.wait_log(each.logged, before)) << daemon_.log().substr(before);
            ASSERT_TRUE(each.reply.empty() || receive_text(client.get()) == each.reply);
            ASSERT_TRUE(kind == datagram || is_served(client.get(), kind));
        }
    }
    expect_nothing_kept();
}

// Whether the kernel refuses them to the sender or hands them over.
void attach_descriptors() {
    const unique_fd attached(open(".", O_RDONLY | O_CLOEXEC));
    std::array<int, 253> copies;
    copies.fill(attached.get());
    alignas(cmsghdr) std::array<char, CMSG_SPACE(sizeof copies)> control = {};
    for (const socket_kind kind : all_kinds) {
        const unique_fd client = connect_client(kind);
        std::string text = kind == stream ? framed("EV p n x") : "EV p n x";
        iovec piece = {text.data(), text.size()};
        msghdr message = {};
        message.msg_iov = &piece;
        message.msg_iovlen = 1;
        message.msg_control = control.data();
        message.msg_controllen = control.size();
        cmsghdr* const header = CMSG_FIRSTHDR(&message);
        *header = {CMSG_LEN(sizeof copies), SOL_SOCKET, SCM_RIGHTS};
        memcpy(CMSG_DATA(header), copies.data(), sizeof copies);
        for (int i = 0; i < 300; ++i) {
            EXPECT_TRUE(sendmsg(client.get(), &message, MSG_NOSIGNAL) > 0 || errno == EPERM ||
                        errno == ETOOMANYREFS)
                << strerror(errno);
        }
    }
}

void send_nothing() {
    const unique_fd sender = connect_client(datagram);
    for (int i = 0; i < 20; ++i) EXPECT_TRUE(send_text(sender.get(), ""));
    const unique_fd client = connect_client(packets);
    EXPECT_TRUE(send_text(client.get(), ""));  // looks like the end of the connection
    EXPECT_EQ(receive_text(client.get()), "");
}

void close_before_the_reply() {
    for (int i = 0; i < 200; ++i) {
        EXPECT_TRUE(send_text(connect_client(stream).get(), "HD 2 IA"));
        EXPECT_TRUE(send_text(connect_client(packets).get(), "IA"));
    }
}

void close_on_unread_replies() {
    for (const socket_kind kind : connection_kinds) {
        const unique_fd client = connect_client(kind);
        for (int i = 0; i < 20; ++i) {
            EXPECT_TRUE(send_text(client.get(), kind == stream ? "HD 2 IA" : "IA"));
            EXPECT_TRUE(wait_taken(client.get()));
        }
    }
}

void send_out_of_band() {
    const unique_fd client = connect_client(stream);
    EXPECT_EQ(send(client.get(), "X", 1, MSG_OOB), 1);
    expect_service();
    EXPECT_EQ(ask(client.get(), "HD 2 IA"), "1");
}

// A byte now and then for far longer than anyone else is made to wait.
void trickle() {
    const unique_fd slow = connect_client(stream);
    EXPECT_TRUE(send_text(slow.get(), "HD 31000 "));
    std::atomic<bool> served = false;
    std::thread sender([&] {
        for (int i = 0; i < 300 && !served; ++i) {
            (void)send(slow.get(), "x", 1, MSG_NOSIGNAL);
            (void)wait_until([&] { return served.load(); }, 100);
        }
    });
    expect_service();
    served = true;
    sender.join();
}

// One reply more than the client's queue holds.
void never_read_replies() {
    const unique_fd deaf = connect_client(packets);
    bool replied = true;
    for (int replies = 0; replied && replies < 10000; ++replies) {
        EXPECT_TRUE(send_text(deaf.get(), "IA"));
        int queued = 0;
        replied = wait_until(
            [&] { return ioctl(deaf.get(), FIONREAD, &queued) == 0 && queued > replies; }, 1000);
    }
    expect_service();
}

void hang_up_during_a_flush() {
    for (int round = 0; round < 20; ++round) {
        std::vector<unique_fd> clients(50);
        for (unique_fd& each : clients) each = connect_client(round % 2 == 0 ? packets : stream);
        request({"EV p n " + std::string(20000, 'x'), "FL"});
        clients.clear();
    }
}

void many_at_once() {
    std::vector<unique_fd> clients(500);
    for (unique_fd& each : clients) each = connect_client(packets);
    for (const unique_fd& each : clients) EXPECT_TRUE(send_text(each.get(), "IA"));
    for (const unique_fd& each : clients) EXPECT_EQ(receive_text(each.get()), "1");
}

TEST_F(hostile, nothing_that_a_client_does_harms_the_others_or_stays) {
    begin({{"-C"}});
    const struct {
        const char* name;
        void (*act)();
        const char* logged;
    } behaviours[] = {
        {"attached descriptors", attach_descriptors, ""},
        {"empty packets", send_nothing, ""},
        {"close before the reply", close_before_the_reply, "failed to send to client"},
        {"close on unread replies", close_on_unread_replies,
         "E kivd: recvfrom() error from client"},
        {"out of band", send_out_of_band, "Invalid packet for stream from client"},
        {"trickling sender", trickle, "Incomplete packet for stream from client"},
        {"replies never read", never_read_replies, "E kivd: receive_seq_client: failed to send to"},
        {"hang-up during a flush", hang_up_during_a_flush, "Generating Report..."},
        {"many at once", many_at_once, ""},
    };
    for (const auto& each : behaviours) {
        SCOPED_TRACE(each.name);
        const size_t before = daemon_.log().size();
        each.act();
        EXPECT_TRUE(daemon_.wait_log(each.logged, before)) << daemon_.log().substr(before);
        expect_nothing_kept();
        if (HasFailure()) return;  // what follows would only wait
    }
    EXPECT_TRUE(daemon_.wait_idle());
    EXPECT_EQ(daemon_.stop(), 0) << daemon_.log();
}

TEST_F(hostile, clients_that_take_all_descriptors_leave_it_enough_to_work_with) {
    begin({{"-C"}, 64});
    const unique_fd early = connect_client(packets);
    ASSERT_EQ(ask(early.get(), "IA"), "1");
    std::vector<unique_fd> clients(200);
    for (unique_fd& each : clients) {
        each = connect_client(stream);
        ASSERT_TRUE(each.ok());
    }
    ASSERT_TRUE(daemon_.wait_log("E kivd: Accept failed: Too many open files."));
    ASSERT_TRUE(daemon_.wait_idle());

    for (const char* request : {"CI p counter 1", "EV p event x", "SG group", "FS", "FL"}) {
        ASSERT_TRUE(send_text(early.get(), request));
    }
    ASSERT_EQ(ask(early.get(), "IA"), "1");
    ASSERT_TRUE(exists("private/counters.txt"));
    const kiv::Report report = wait_report(1);
    ASSERT_FALSE(HasFailure());
    EXPECT_EQ(report.counters(report.counters_size() - 1).name(), "counter");
    EXPECT_EQ(report.events(report.events_size() - 1).name(), "event");
    EXPECT_EQ(ask(clients.front().get(), "HD 2 IA"), "1");
    EXPECT_EQ(ask(clients.back().get(), "HD 2 IA"), "");  // told at once, not left waiting

    clients.clear();
    descriptors_ += 1;  // the early client's
    expect_nothing_kept();
}

}  // namespace
}  // namespace kivd
