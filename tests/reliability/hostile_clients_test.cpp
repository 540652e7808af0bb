// Clients that send what they should not, stop half-way or come in masses: whatever they do, the
// daemon names it, serves the others and holds on to nothing. What the content of a packet may do
// is shown with the requests.
#include <chrono>
#include <csignal>
#include <cstring>
#include <thread>

#include "end_to_end/debug_port.h"
#include "support/config_package.h"

namespace kivd {
namespace {

using enum socket_kind;

const std::string largest(31176, 'X');
const std::string zeros(31170, '0');

constexpr char incomplete[] = "Incomplete packet for stream from client";
constexpr char invalid[] = "Invalid packet for stream from client";
constexpr char no_length[] = "No length marked by client";
constexpr char bad_size[] = "Incorrect size of packet from client";
constexpr char too_large[] = "Too large packet (";

// Each piece when the one before has been taken.
void send_pieces(const unique_fd& client, const std::vector<std::string>& pieces) {
    for (const std::string& piece : pieces) {
        EXPECT_TRUE(wait_taken(client.get()));
        // The daemon may look for more in the same call still.
        std::this_thread::sleep_for(std::chrono::milliseconds(2));
        EXPECT_TRUE(send_text(client.get(), piece));
    }
}

// They come one by one or together.
std::string hear(const unique_fd& client, size_t size) {
    std::string heard;
    for (size_t before = 1; heard.size() < size && before != heard.size();) {
        before = heard.size();
        heard += receive_text(client.get());
    }
    return heard;
}

void flood(const unique_fd& client, int count, const std::string& text) {
    for (int i = 0; i < count; ++i) ASSERT_TRUE(send_text(client.get(), text));
}

void expect_service() {
    EXPECT_EQ(ask(connect_client(packets).get(), "IA"), "1");
    EXPECT_EQ(ask(connect_client(stream).get(), "HD 2 IA"), "1");
}

template <class test>
class besieged : public test {
 protected:
    void besiege(const start_options& options) {
        daemon = this->start(options);
        request({"XY", "EV p first x"});  // what it opens at the first use, it keeps
        expect_service();
        EXPECT_TRUE(daemon.wait_idle());
        descriptors = daemon.descriptors();
    }
    void expect_nothing_kept() {
        expect_service();
        request({"EV p last x"});  // opens the event file again
        EXPECT_TRUE(wait_until([this] { return daemon.descriptors() == descriptors; }))
            << daemon.descriptors() << " descriptors instead of " << descriptors;
        EXPECT_EQ(daemon.stop(), 0) << daemon.log();
    }

    daemon_process daemon;
    size_t descriptors = 0;
};
using hostile_clients = besieged<daemon_test>;
using hostile_debug_clients = besieged<debug_port_test>;

TEST_F(hostile_clients, do_not_keep_to_the_frame) {
    besiege({{"-C"}});
    const std::string id = ask(connect_client(packets).get(), "GD");
    const struct {
        const char* name;
        std::vector<std::string> pieces;
        std::vector<std::string> logged = {};
        std::string replies = {};
    } cases[] = {
        {"one after the other", {"HD 2 IA", "HD 2 IA"}, {}, "11"},  // no wait for more
        {"in pieces", {"HD 2", " ", "I", "A"}, {}, "1"},
        {"delimiters", {"HD\t2\nIA", "HD\r2\r\nIA", "IA"}, {incomplete, invalid}, "1"},
        {"odd lengths", {"HD +2 IA", "HD 2x IA", "HD " + zeros.substr(1000) + "2 IA"}, {}, "111"},
        {"up to the end of the buffer", {"HD " + zeros + "2", " GD"}, {}, id},  // and beyond it
        {"a byte more", {"HD 0" + zeros + "2", " GD"}, {"no data from peer", incomplete, invalid}},
        {"letters", {"H", "hd 2 IA", "\0HD 2 IA"s, " HD 2 IA"}, {invalid}},
        {"no length", {"HD", "HD ", "HD\0 2 IA"s, "HD \r\n\t"}, {no_length}},
        {"no number", {"HD -1 IA", "HD 0 IA", "HD 0x10 IA", "HD IA"}, {bad_size}},
        {"too long", {"HD 31177 IA", "HD 4294967298 IA", "HD 99999999999999999999 IA"}, {bad_size}},
        {"digits in two", {"HD 2", "0 IA IA IA IA IA"}, {incomplete}},
        {"two at once", {"HD 2 IAHD 2 IA"}, {incomplete}},
        {"header too long", {"HDHD 2 IA", "HD  2 IA"}, {incomplete}},
        {"larger than the buffer", {"HD 31176 ", std::string(31168, 'X')}, {incomplete}},
        {"flood of bytes", {std::string(100000, 'H')}, {too_large}},
    };
    for (const auto& each : cases) {
        SCOPED_TRACE(each.name);
        const size_t from = daemon.log().size();
        const unique_fd client = connect_client(stream);
        send_pieces(client, each.pieces);
        EXPECT_EQ(hear(client, each.replies.size()), each.replies);
        for (const std::string& text : each.logged) EXPECT_TRUE(daemon.wait_log(text, from));
        send_pieces(client, {"HD 2 IA"});
        EXPECT_EQ(receive_text(client.get()), "1");
    }
    unique_fd client = connect_client(stream);
    EXPECT_TRUE(send_text(client.get(), "HD 2 I"));
    EXPECT_EQ(send(client.get(), "A", 1, MSG_OOB), 1);  // out of band
    EXPECT_EQ(receive_text(client.get()), "1");
    client.reset();
    for (const socket_kind kind : {datagram, packets}) {
        const size_t from = daemon.log().size();
        EXPECT_TRUE(send_text(connect_client(kind).get(), largest));
        EXPECT_TRUE(daemon.wait_log("Bad command: 88/88 - dropping", from));
        EXPECT_TRUE(send_text(connect_client(kind).get(), largest + "X"));
        EXPECT_TRUE(daemon.wait_log(too_large, from));
        if (kind == datagram) flood(connect_client(kind), 100, "");
    }
    expect_nothing_kept();
}

// While they go on, however many they are. What made others wait took seconds for each of them.
TEST_F(hostile_clients, cost_others_no_time) {
    besiege({{"-C"}});
    request({"WC " + config_file({{"shop", "prices", "content"}}), "NC"});
    const struct {
        const char* name;
        socket_kind kind;
        const char* text;
        bool hangs_up;
    } cases[] = {
        {"half a packet", stream, "HD 9 x", false},
        {"a byte too few, again and again", stream, "HD 3 IA", false},
        {"unread answers", packets, "IA", false},
        {"unread answers of a stream", stream, "HD 2 IA", false},
        {"unread descriptors", packets, "GC shop prices", false},
        {"refused requests", datagram, "FL", false},
        {"here and gone", stream, "HD 9 x", true},
    };
    unique_fd victim = connect_client(packets);
    for (const auto& each : cases) {
        for (const size_t count : {1, 10, 50}) {
            SCOPED_TRACE(testing::Message() << each.name << ", " << count);
            std::vector<unique_fd> clients(count);
            for (int round = 0; round < 50; ++round) {
                for (unique_fd& client : clients) {
                    if (!client.ok() || each.hangs_up) client = connect_client(each.kind);
                    (void)send(client.get(), each.text, strlen(each.text),
                               MSG_DONTWAIT | MSG_NOSIGNAL);
                }
                const auto start = std::chrono::steady_clock::now();
                EXPECT_EQ(ask(victim.get(), "IA"), "1");
                EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(1));
            }
        }
    }
    victim.reset();
    expect_nothing_kept();
}

// Each of them is given up in time, and told.
TEST_F(hostile_clients, are_given_up_in_time) {
    besiege({{"-C"}});
    request({"WC " + config_file({{"shop", "prices", "content"}}), "NC"});
    unique_fd trickling = connect_client(stream);
    send_pieces(trickling, {"HD 31000 "});
    const size_t from = daemon.log().size();
    // It has 3 seconds, and then some of a busy machine's.
    for (int i = 0; i < 60 && daemon.log(from).find(incomplete) == std::string::npos; ++i) {
        EXPECT_TRUE(send_text(trickling.get(), "x"));
        std::this_thread::sleep_for(std::chrono::milliseconds(100));
    }
    EXPECT_NE(daemon.log(from).find(incomplete), std::string::npos);
    expect_service();
    trickling.reset();
    for (const auto& [packet, count, told] :
         {std::tuple("IA", 500, "errno=11"), {"GC shop prices", 400, "fd-message"}}) {
        const unique_fd client = connect_client(packets);
        flood(client, count, packet);  // with replies that nobody reads
        std::this_thread::sleep_for(std::chrono::milliseconds(400));
        EXPECT_EQ(daemon.count_in_log(told), 0U);  // it may read them yet
        EXPECT_TRUE(daemon.wait_log(told));
        expect_service();
    }
    expect_nothing_kept();
}

// What there is to do goes on, and those who were there before are served.
TEST_F(hostile_clients, take_all_descriptors) {
    const uid_t user = getuid() == 0 ? 65534 : 0;  // root would have more under way
    ASSERT_EQ(user == 0 ? 0 : chown(".", user, user), 0);
    besiege({{"-C"}, 64, user});
    unique_fd early = connect_client(packets);
    EXPECT_EQ(ask(early.get(), "IA"), "1");
    std::vector<unique_fd> clients(36);  // 31 places beside the early one, and as many as queue up
    for (unique_fd& each : clients) each = connect_client(stream);
    EXPECT_TRUE(daemon.wait_log("E kivd: Accept failed: Too many open files."));
    for (const char* packet : {"CI p counter 1", "EV p event x", "SG group", "FS", "FL"}) {
        EXPECT_TRUE(send_text(early.get(), packet));
    }
    EXPECT_EQ(ask(early.get(), "IA"), "1");
    EXPECT_TRUE(exists("private/counters.txt"));
    EXPECT_EQ(wait_report(1).events().rbegin()->name(), "event");
    EXPECT_EQ(ask(clients.front().get(), "HD 2 IA"), "1");
    clients.front().reset();
    EXPECT_EQ(ask(clients[31].get(), "HD 2 IA"), "1");  // left in the queue, and served in turn
    clients.clear();
    early.reset();
    expect_nothing_kept();
}

// The debug interface's frame about a short packet.
std::string frame(const std::string& packet) {
    const auto size = static_cast<char>(packet.size());
    return "\0\0\0"s + static_cast<char>(size + 2) + "\x0a" + size + packet;
}

// How many calls have written to files.
size_t writes_of(const daemon_process& daemon) {
    const std::string text = read_file("/proc/" + std::to_string(daemon.pid()) + "/io");
    return std::stoul(text.substr(text.find("syscw: ") + 7));
}

TEST_F(hostile_debug_clients, see_every_request_of_others_and_cost_nothing) {
    besiege({{"-C", "-d"}});
    std::filesystem::create_directory("other");
    daemon_process other(KIVD_PATH,
                         {{"-D", "-d", "-b", directory + "/other", "-c", "NO_ENCRYPTION"}});
    EXPECT_EQ(other.wait_exit(), 1);  // the port is taken
    EXPECT_EQ(other.count_in_log("E kivd-kivddi: Cannot bind to di-socket"), 1U);

    const unique_fd first = connect_debugger();
    expect_service();  // by now it has been accepted
    unique_fd debugger = connect_debugger();
    (void)hear(first, SIZE_MAX);  // until it is hung up on, since another one has its place
    EXPECT_TRUE(send_text(debugger.get(), "RM 0 and more than ten bytes"));  // not a request
    EXPECT_EQ(ask(connect_client(stream).get(), "HD 2 IA"), "1");
    EXPECT_TRUE(send_text(connect_client(datagram).get(), "EV p \xff \0y"s));
    const std::string expected = frame("IA") + frame("EV p \xff \0y"s);
    EXPECT_EQ(hear(debugger, expected.size()), expected);

    // Each event is stored before the next request is shown, and together when nobody looks.
    for (const bool is_watched : {true, false}) {
        expect_service();
        daemon.send_signal(SIGSTOP);
        const size_t writes = writes_of(daemon);
        flood(connect_client(datagram), 5, "EV p n x");
        daemon.send_signal(SIGCONT);
        expect_service();
        EXPECT_EQ(writes_of(daemon) - writes == 5, is_watched);
        debugger.reset();
    }

    flood(connect_client(packets), 2000, "EV p n " + std::string(30000, 'x'));  // read by nobody
    debugger = connect_debugger();
    expect_service();
    daemon.send_signal(SIGSTOP);
    EXPECT_TRUE(send_text(connect_client(datagram).get(), "EV p n x"));
    debugger.reset();
    daemon.send_signal(SIGCONT);
    EXPECT_TRUE(daemon.wait_log("E kivd-kivddi: Fail to send to socket: "));
    std::vector<unique_fd> crowd(50);
    for (unique_fd& each : crowd) each = connect_debugger();
    expect_service();
    crowd.clear();
    expect_nothing_kept();
}

}  // namespace
}  // namespace kivd
