// Clients that send what they should not, stop half-way or come in masses: whatever they do, the
// daemon names it, serves the others and holds on to nothing. What the content of a packet may do
// is shown with the requests.
#include "client_steps.h"
#include "end_to_end/debug_port.h"
#include "support/config_package.h"

namespace kivd {
namespace {

using enum way;

using hostile_clients = besieged<daemon_test>;
using hostile_debug_clients = besieged<debug_port_test>;

const std::vector<way> everywhere = {datagram, packets, framed};
const std::vector<way> raw = {bytes};

const std::string largest(31176, 'X');
const std::string zeros(31170, '0');
// A part that can be asked for: announced, and got.
const std::string part = "WC " + config_file({{"shop", "prices", "content"}});
const std::string get_part = "GC shop prices";

const std::string invalid = "E kivd: Invalid packet for stream from client N, dropping.";
const std::string no_length = "E kivd: No length marked by client N";
const std::string bad_size = "E kivd: Incorrect size of packet from client N, dropping.";
const std::string gone = "E kivd: Client N disconnected, no data from peer";
const std::string incomplete = "E kivd: Incomplete packet for stream from client N, dropping.";
const std::string too_large = "E kivd: Too large packet (";
const std::string reset = "E kivd: recvfrom() error from client N, Connection reset by peer";
const std::string full = "failed to send to client N, errno=11 (Resource temporarily unavailable)";
const std::string unsent = "_client: failed to send to client N, errno=";
const std::string no_part = "E kivd: Failed to send fd-message to client N";
const std::string no_accept = "E kivd: Accept failed: Too many open files.";

// clang-format off
TEST_F(hostile_clients, send_requests_that_are_none) {
    withstand({{"-C"}}, {
        {"no command", everywhere, {"\0IA"s, " \t\r\n"}, {"Invalid command: none - dropping."}},
        {"no probe and no value", everywhere, {"EV", "CS p n"}, {"[EV] Null", "[CS] Null"}},
        {"largest packet", {datagram, packets}, {largest}, {"Bad command: 88/88 - dropping"}},
        {"a byte too large", {datagram, packets}, {largest + "X"}, {too_large}},
        {"much too large", {datagram, packets}, {std::string(200000, 'X')}, {too_large}},
        {"empty datagrams", {datagram}, {flood(1000, "")}},
        {"configuration of junk", everywhere, {"WC \x12\x04junk", "NC"},
         {"E kivd-conf: Failed to parse configuration"}, "0"},
        {"full queue", {datagram}, {hold, repeat(11, {"XY", hang_up}), let_go}, {"command: 88/89"}},
        {"gone before the reply", {packets, framed},
         {repeat(50, {"IA", hears("1"), hold, "IA", hang_up, let_go})}, {unsent}},
        {"all at once", {packets, framed}, {repeat(500, {"IA", keep}), others_are_served, release},
         {maybe(reset)}},
    });
}

step out_of_band(char byte) {
    return [byte](attack& a) { EXPECT_EQ(send(a.fd(), &byte, 1, MSG_OOB), 1); };
}

// On the stream socket; each piece is sent when the one before was taken.
TEST_F(hostile_clients, do_not_keep_to_the_frame) {
    const step reply_at_the_end = [](attack& a) {
        const std::string id = ask(connect_client(socket_kind::packets).get(), "GD");
        take(a, {"HD " + zeros + "2", " GD", hears(id)});
    };
    withstand({{"-C"}}, {
        {"one after the other", raw, {"HD 2 IA", "HD 2 IA"}, {}, "11"},  // no wait for more
        {"in pieces", raw, {"HD 2", " ", "I", "A"}, {}, "1"},
        {"byte by byte", raw, {"HD 5000 ", "EV p n ", flood(4993, "x")}},
        {"all delimiters", raw, {"HD\t2\nIA", hears("1"), "HD\r2\r\nIA", "IA"},
         {incomplete, invalid}},
        {"odd lengths", raw, {"HD +2 IA", hears("1"), "HD 2x IA", hears("1"),
                              "HD " + zeros.substr(1000) + "2 IA"}, {}, "1"},
        {"up to the end of the buffer", raw, {reply_at_the_end}},  // so the reply goes beyond it
        {"a byte beyond it", raw, {"HD 0" + zeros + "2", " GD"}, {gone, incomplete, invalid}},
        {"letters", raw, {"H", "hd 2 IA", "\0HD 2 IA"s, " HD 2 IA"}, {invalid}},
        {"no length", raw, {"HD", "HD ", "HD\0 2 IA"s, "HD \r\n\t"}, {no_length}},
        {"lengths that are none", raw,
         {"HD -1 IA", "HD 0 IA", "HD 0x10 IA", "HD 31177 IA", "HD IA", "HD 4294967298 IA",
          "HD 99999999999999999999 IA", "HD -99999999999999999999 IA"}, {bad_size}},
        {"digits in two", raw, {"HD 2", "0 IA IA IA IA IA"}, {incomplete}},
        {"two at once", raw, {"HD 2 IAHD 2 IA"}, {incomplete}},
        {"header too long", raw, {"HDHD 2 IA", "HD  2 IA"}, {incomplete}},
        {"larger than the buffer", raw, {"HD 31176 ", std::string(31168, 'X')}, {gone, incomplete}},
        {"flood of bytes", raw, {std::string(100000, 'H')}, {too_large, maybe(invalid)}},
        {"no more to come", raw, {"HD 9 IA", hang_up}, {gone, incomplete}},
        {"out of band", raw, {out_of_band('X'), daemon_is_idle}, {invalid}},
        {"out of band in the middle", raw, {"HD 2 I", out_of_band('A')}, {}, "1"},
    });
}

// On and on, with no gap that is too long.
void trickle(attack& a) {
    take(a, {"HD 31000 "});
    for (int i = 0; i < 100 && !a.has_logged("Incomplete"); ++i) {
        take(a, {flood(1, "x")});
        (void)wait_until([&] { return a.has_logged("Incomplete"); }, 100);
    }
    take(a, {is_logged("Incomplete"), others_are_served, "x"});
}

// Each of them costs the others seconds, and no more than that.
TEST_F(hostile_clients, make_others_wait) {
    withstand({{"-C"}}, {
        {"header only", raw, {repeat(3, {"HD 9 ", keep}), others_are_served, release},
         {gone, incomplete}},
        {"trickle", raw, {trickle}, {gone, incomplete, invalid}},
        {"replies never read", {packets},
         {flood(500, "IA"), is_logged("errno=11"), others_are_served, hang_up},
         {full, unsent, maybe(reset)}},
        {"a part to ask for", {packets}, {part, "NC"}, {}, "1"},
        {"descriptors never read", {packets},
         {flood(400, get_part), is_logged("fd-message"), others_are_served, hang_up},
         {no_part, maybe(reset)}},
    });
}

// What there is to do goes on, and those who were there before are served.
void take_all_descriptors(attack& a) {
    take(a, {"IA", hears("1")});
    std::vector<unique_fd> clients(200);
    for (unique_fd& each : clients) each = connect_client(socket_kind::stream);
    take(a, {is_logged(no_accept), daemon_is_idle, "CI p counter 1", "EV p event x", "SG group",
             "FS", "FL", "IA", hears("1")});
    EXPECT_TRUE(exists("private/counters.txt"));
    const kiv::Report report = wait_report(1);
    ASSERT_FALSE(testing::Test::HasFailure());
    EXPECT_EQ(report.counters(report.counters_size() - 1).name(), "counter");
    EXPECT_EQ(report.events(report.events_size() - 1).name(), "event");
    EXPECT_EQ(ask(clients.front().get(), "HD 2 IA"), "1");
    EXPECT_EQ(ask(clients.back().get(), "HD 2 IA"), "");  // told at once, not left waiting
}

TEST_F(hostile_clients, take_all_descriptors) {
    const uid_t user = getuid() == 0 ? 65534 : 0;  // root would have more under way
    ASSERT_EQ(user == 0 ? 0 : chown(".", user, user), 0);
    withstand({{"-C"}, 64, user}, {
        {"connections", {packets}, {take_all_descriptors}, {no_accept}},
    });
}

TEST_F(hostile_debug_clients, cost_nothing) {
    const std::string lost = "E kivd-kivddi: Fail to send to socket: ";
    const step debugger = [](attack& a) { a.kept.push_back(connect_debugger()); };
    const step alive = repeat(1, {"IA", hears("1")});  // by now it has been accepted
    const step sees_event = [](attack& a) {
        std::string seen, more;
        do seen += more = receive_text(a.kept.back().get());
        while (!more.empty() && !seen.ends_with("EV p n x"));
        EXPECT_NE(more, "");
    };
    const step events = flood(2000, "EV p n " + std::string(30000, 'x'));
    const std::vector<std::string> perhaps = {maybe(lost)};
    withstand({{"-C", "-d"}}, {
        {"stops reading", {packets}, {debugger, alive, events, alive, release}, perhaps},
        {"gone before the frame", {packets},
         {debugger, alive, hold, "EV p n x", release, let_go}, {lost}},
        {"in crowds", {packets}, {repeat(50, {debugger, alive}), "EV p n x", sees_event, release},
         perhaps},
    });
}
// clang-format on

}  // namespace
}  // namespace kivd
