// Clients that send what they should not, stop half-way or come in masses: whatever they do, the
// daemon names it, serves the others and holds on to nothing.
#include <netinet/in.h>
#include <sys/resource.h>
#include <sys/stat.h>

#include <fstream>

#include "client_steps.h"
#include "end_to_end/debug_port.h"
#include "support/config_package.h"
#include "system_logging.pb.h"

namespace kivd {
namespace {

using namespace std::string_literals;
using enum way;

using hostile_clients = besieged<daemon_test>;
using hostile_debug_clients = besieged<debug_port_test>;

const std::vector<way> everywhere = {datagram, packets, framed};
const std::vector<way> whole = {datagram, packets};
const std::vector<way> connections = {packets, framed};
const std::vector<way> raw = {bytes};

const std::string largest(31176, 'X');
const std::string percents(31000, '%');
const std::string zeros(31170, '0');
// A part that can be asked for: announced, and got.
const std::string part = "WC " + config_file({{"shop", "prices", "content"}});
const std::string get_part = "GC shop prices";

const std::string no_command = "E kivd: Invalid command: none - dropping.";
const std::string bad_xy = "E kivd: Bad command: 88/89 - dropping";
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
const std::string deleted = "W kivd-compactor: Failed to stat output/kiv_";  // as it was listed
const std::string no_unpack = "E kivd-conf: Failed to unpack configuration";
const std::string no_message = "E kivd-qz: Failed to unpack protobuf LogMessage";

// A log message with a list in a field in a list, as deep as a payload can be.
std::string nested_message() {
    std::string nested;
    for (int depth = 9000; depth > 0; --depth) {
        std::string head = depth == 1 ? "\x4a" : depth % 2 == 0 ? "\x0a" : "\x22";
        size_t rest = nested.size();
        for (; rest > 127; rest >>= 7) head += static_cast<char>(rest | 128);
        nested.insert(0, head += static_cast<char>(rest));
    }
    kiv::system_logging::LogMessage outermost;
    outermost.set_log(kiv::system_logging::MAIN);
    outermost.set_tag("am_crash");
    return outermost.SerializeAsString() + nested;
}

// Whatever its address is, there are no answers to datagrams.
void ask_with_an_address(attack& a) {
    const sockaddr own = {AF_UNIX, {}};
    EXPECT_EQ(bind(a.fd(), &own, sizeof own.sa_family), 0);
    take(a, {"IA", "GD", "NC", "FN 750 0", get_part, "FG 1 1", "PA p n", others_are_served});
    char byte = 0;
    EXPECT_EQ(recv(a.fd(), &byte, 1, MSG_DONTWAIT), -1);
}

// clang-format off
TEST_F(hostile_clients, send_requests_that_are_none) {
    const std::string log = "EV kiv.system_logging LogMessage ";
    withstand({{"-C"}}, {
        {"no command", everywhere, {"\0IA"s, " \t\r\n", " \0"s}, {no_command}},
        {"letters too few, many and small", everywhere, {"E\0V a b"s, "E", "EVX a b", "ev a b"},
         {"Bad command: 69/0 ", "Bad command: 69/86 ", "Bad command: 101/118 "}},
        {"bytes above 127", everywhere, {"\xff\x80 x"}, {"Bad command: 255/128 - dropping"}},
        {"no probe", everywhere, {"EV", "CS p", "CI", "SD p", "PA p", "GC"},
         {"[EV] Null in probe id - dropping. [null:null]",
          "[CS] Null in probe id - dropping. [p:null]", "[CI] Null in probe id",
          "[SD] Null in probe id", "[PA] Null in probe id", "[GC] Null in probe id"}},
        {"no value", everywhere, {"CS p n", "CI p n ", "SD p n \0v"s},
         {"[CS] Null in probe value - dropping. [p:n]", "[CI] Null in probe value",
          "[SD] Null in probe value"}},
        {"no argument", everywhere, {"DC", "RM ", "SN", "IM", "SG", "DG", "RG n"},
         {"Enable/disable data collection without value.", "Remove report without number.",
          "set_serial_number without value.", "set_imei without value.",
          "set_group_id without value.", "delete_group_id without value.",
          "replace_group_id without valid value."}},
        {"formats", everywhere,
         {"CS %n%s%x %s%n", "CS " + percents, "SG %n%s%x", "DG %n%s%x", "IM %n"},
         {"[CS] Null in probe value - dropping. [%n%s%x:%s%n]",
          "[CS] Null in probe id - dropping. [%%%"}},
        {"probe of 257 bytes", everywhere,
         {"EV " + std::string(200, 'p') + " " + std::string(57, 'n')},
         {"[EV] To large probe id, 257 > 256 - dropping. [pp"}},
        {"payload of 30721 bytes", everywhere, {"EV p n " + std::string(30721, 'x')},
         {"Too large event - dropping. [p:n] 30721 bytes"}},
        {"largest packet", whole, {largest}, {"Bad command: 88/88 - dropping"}},
        {"a byte too large", whole, {largest + "X"}, {too_large}},
        {"much too large", whole, {std::string(200000, 'X')}, {too_large}},
        {"no numbers", everywhere,
         {"CS p n abc", "CI p n -", "CI p n 99999999999999999999", "CS p n 0x10"}},
        {"not text", everywhere,
         {"EV \xff\xfe \xc3", "SD \x80 \xff " + std::string(255, 'x') + "\xc3\xa4",
          "CI \x01 \x7f 1"}},
        {"liveness and 31000 blanks", everywhere, {"IA" + std::string(31000, ' ')}, {}, "1"},
        {"wanted or not", everywhere, {"PA %n ..", "PA a b c d e"}, {}, "11"},
        {"parts that nobody has", everywhere,
         {"GC %n%s %x", "GC ../../etc passwd", "GC kivd _last_id", "GC kivd " + percents},
         {"[GC] To large probe id, 31004 > 256"}, "FAILFAILFAIL"},
        {"files that nobody has", everywhere,
         {"FG 750 ../../kivd.pid", "FG 750 -1", "FG /etc/passwd 0", "FG 750 99999999999", "FG 750"},
         {"Badly formatted packet (FG) - dropping."}, "FAILFAILFAILFAILFAIL"},
        {"next of no file", everywhere, {"FN 750 2147483647", "FN 99999999999 x", "FN"},
         {"E kivd-fu: File iterator next, null parameters found."}, "-1-1"},
        {"reports that are not there", everywhere, {"RM 2147483647", "RM -1"},
         {"W kivd-util: Failed to delete output/kiv_2147483647 : No such file",
          "W kivd-util: Failed to delete output/kiv_-1 : No such file"}},
        {"words for numbers", everywhere, {"EV p n x", "FL", "RM all", "DC on", "CI p", "DC 1"},
         {maybe(deleted)}},
        {"configuration cut short", everywhere, {"WC", "NC", "WC ", "NC"},
         {"Badly formatted packet (WC) - dropping.", no_unpack}, "00"},
        {"configuration of junk", everywhere,
         {"WC \x12" + std::string(31000, '\xff'), "NC", "WC \x12\x04junk", "NC"},
         {"E kivd-conf: Corrupt file - bad field length", no_unpack,
          "E kivd-conf: Failed to parse configuration"}, "00"},
        {"odd group ids, and too many", everywhere,
         {"SG a\vb\fc", "SG " + std::string(40, 'g'),
          repeat(3, {"SG 1", "SG 2", "SG 3", "SG 4", "RG 5 4", "DG 5"})}},
        {"messages in messages", everywhere,
         {"DC 1", log + "\x4a\xff\xff\xff\xff\x0f", log + nested_message()}, {no_message}},
        {"messages by the hundred", whole, {flood(500, log + std::string(3000, '\xff'))},
         {no_message}},
        {"a sender with an address", {datagram}, {ask_with_an_address}},
    });
}

// On the stream socket; each piece is sent when the one before was taken.
TEST_F(hostile_clients, do_not_keep_to_the_frame) {
    const step reply_at_the_end = [](attack& a) {
        const std::string id = ask(connect_client(socket_kind::packets).get(), "GD");
        take(a, {"HD " + zeros + "2", " GD", hears(id)});
    };
    withstand({{"-C"}}, {
        {"in pieces", raw, {"HD 2", " ", "I", "A"}, {}, "1"},
        {"byte by byte", raw, {"HD 5000 ", "EV p n ", flood(4993, "x")}},
        {"all delimiters", raw, {"HD\t2\nIA", hears("1"), "HD\r2\r\nIA", "IA"},
         {incomplete, invalid}},
        {"odd lengths", raw, {"HD +2 IA", hears("1"), "HD 2x IA", hears("1"),
                              "HD " + zeros.substr(1000) + "2 IA"}, {}, "1"},
        {"up to the end of the buffer", raw, {reply_at_the_end}},  // so the reply goes beyond it
        {"a byte beyond it", raw, {"HD 0" + zeros + "2", " GD"}, {gone, incomplete, invalid}},
        {"letters", raw, {"H", "hd 2 IA", "\0HD 2 IA"s, "\xff\xff", " HD 2 IA"}, {invalid}},
        {"no length", raw, {"HD", "HD ", "HD\0 2 IA"s, "HD \r\n\t"}, {no_length}},
        {"header in two", raw, {"HD ", "2 IA"}, {no_length, invalid}},
        {"lengths that are none", raw,
         {"HD -1 IA", "HD 0 IA", "HD 0x10 IA", "HD 31177 IA", "HD IA", "HD 4294967298 IA",
          "HD 99999999999999999999 IA", "HD -99999999999999999999 IA"}, {bad_size}},
        {"digits in two", raw, {"HD 2", "0 IA IA IA IA IA"}, {incomplete}},
        {"two at once", raw, {"HD 2 IAHD 2 IA"}, {incomplete}},
        {"header too long", raw, {"HDHD 2 IA", "HD  2 IA"}, {incomplete}},
        {"larger than the buffer", raw, {"HD 31176 ", std::string(31168, 'X')}, {gone, incomplete}},
        {"flood of bytes", raw, {std::string(31177, 'H'), std::string(100000, 'H')},
         {too_large, maybe(invalid)}},
        {"end missing", raw, {"HD 2IA", is_logged("Incomplete")}, {gone, incomplete}},
        {"no more to come", raw, {"HD 9 IA", half_close(SHUT_WR), is_hung_up_on},
         {gone, incomplete}},
        {"out of band", raw, {out_of_band('X'), daemon_is_idle}, {invalid}},
        {"out of band at first", raw, {hold, out_of_band('X'), let_go, daemon_is_idle}, {invalid}},
        {"out of band in the middle", raw, {"HD 2 I", out_of_band('A')}, {}, "1"},
    });
}

void allow_descriptors(rlim_t count) {
    rlimit limit = {};
    EXPECT_EQ(getrlimit(RLIMIT_NOFILE, &limit), 0);
    limit.rlim_cur = std::min(count, limit.rlim_max);
    EXPECT_EQ(setrlimit(RLIMIT_NOFILE, &limit), 0);
}

// A compactor that waits for the reader of a pipe: nothing of the clients' stays open in it.
void leave_while_it_compresses(attack& a) {
    const char* const pipe = "private/flushed_data.compacted";
    EXPECT_EQ(mkfifo(pipe, 0600), 0);
    take(a, {repeat(50, {"IA", hears("1"), keep}), "EV p n x", "FL", "EV p n y", "IA", hears("1")});
    const size_t before = a.daemon.descriptors();
    take(a, {release, others_are_served, half_close(SHUT_WR), is_hung_up_on});
    EXPECT_TRUE(wait_until([&] { return a.daemon.descriptors() == before - 49; }));
    EXPECT_NE(read_file(pipe), "");
    EXPECT_TRUE(wait_until([&] { return !exists(pipe); }));
    take(a, {"RM 0"});
}

TEST_F(hostile_clients, come_and_go) {
    allow_descriptors(1024);  // the daemon takes more
    const step have_many = [](attack&) { allow_descriptors(RLIM_INFINITY); };
    const std::string event = "EV p n " + std::string(20000, 'x');
    withstand({{"-C"}}, {
        {"gone while it compresses", connections, {leave_while_it_compresses}},
        {"nothing said", connections, {repeat(5000, {arrive, hang_up})}},
        {"ended both ways", connections, {arrive, half_close(SHUT_RDWR), is_hung_up_on}},
        {"empty packet", {packets}, {"", is_hung_up_on}},
        {"empty datagrams", {datagram}, {flood(1000, "")}},
        {"gone before the reply", connections,
         {repeat(500, {"IA", hears("1"), hold, "IA", hang_up, let_go})}, {unsent}},
        {"gone at the reply", connections, {repeat(2000, {"IA", hang_up})},
         {maybe(unsent), maybe(reset)}},
        {"gone with replies unread", connections, {repeat(20, {"IA"}), "EV p n x", hang_up},
         {reset, maybe(unsent)}},
        {"no more requests", connections, {"IA", half_close(SHUT_WR), hears("1"), is_hung_up_on}},
        {"no more replies", connections,
         {arrive, half_close(SHUT_RD), "IA", "IA", daemon_is_idle, hang_up}, {unsent}},
        {"idle by the thousand", connections,
         {have_many, repeat(3000, {arrive, keep}), others_are_served, daemon_is_idle, release}},
        {"all at once", connections, {repeat(500, {"IA", keep}), others_are_served, release},
         {maybe(reset)}},
        {"gone during a flush", connections,
         {repeat(20, {repeat(20, {"IA", keep}), event, "FL", hang_up, release})}, {maybe(reset)}},
        {"a part to ask for", {packets}, {part, "NC"}, {}, "1"},
        {"descriptors kept", connections, {repeat(200, {get_part, gets_descriptor})}},
        {"descriptors unread", connections, {repeat(200, {get_part}), hang_up},
         {maybe(reset), maybe(no_part)}},
        {"gone before the descriptor", connections,
         {repeat(500, {"IA", hears("1"), hold, get_part, hang_up, let_go})}, {no_part}},
        {"no more descriptors", connections, {arrive, half_close(SHUT_RD), get_part, hang_up},
         {no_part}},
        {"gone before the file", connections,
         {"DC 1", "EV devicemonitor.powerstat ShutDown x", "FG 750 1", gets_descriptor, hold,
          "FG 750 1", hang_up, let_go}, {no_part}},
    });
}

// On and on, with no gap that is too long.
void trickle(attack& a) {
    take(a, {others_are_served, "HD 31000 ", others_ask});
    bool is_given_up = false;
    for (int i = 0; i < 100 && !is_given_up; ++i) {
        take(a, {flood(1, "x")});
        is_given_up = wait_until([&] { return a.has_logged("Incomplete"); }, 100);
    }
    EXPECT_TRUE(is_given_up);
    take(a, {others_are_answered, "x"});
}

// Each of them costs the others seconds, and no more than that.
TEST_F(hostile_clients, make_others_wait) {
    withstand({{"-C"}}, {
        {"header only", raw, {"HD 2 ", is_logged("Incomplete")}, {gone, incomplete}},
        {"header only, of many", raw, {repeat(3, {"HD 9 ", keep}), others_are_served, release},
         {gone, incomplete}},
        {"trickle", raw, {trickle}, {gone, incomplete, invalid}},
        {"replies never read", {packets},
         {others_are_served, flood(500, "IA"), is_logged("errno=11"), others_are_served, hang_up},
         {full, unsent, maybe(reset)}},
        {"a part to ask for", {packets}, {part, "NC"}, {}, "1"},
        {"descriptors never read", {packets},
         {others_are_served, flood(400, get_part), is_logged("fd-message"), others_are_served,
          hang_up}, {no_part, maybe(reset)}},
    });
}

// A connection whose last close waits for unsent data that nobody takes.
void attach_lingering(attack& a) {
    const unique_fd listener(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
    unique_fd lingering(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
    sockaddr_in address = {};
    socklen_t size = sizeof address;
    auto* const generic = reinterpret_cast<sockaddr*>(&address);
    EXPECT_EQ(listen(listener.get(), 1), 0);
    EXPECT_EQ(getsockname(listener.get(), generic, &size), 0);
    EXPECT_EQ(connect(lingering.get(), generic, size), 0);
    while (send(lingering.get(), largest.data(), largest.size(), MSG_DONTWAIT) > 0) continue;
    take(a, {arrive, hold});
    if (send_with(a, SCM_RIGHTS, bytes_of(lingering.get()), "EV p n x") == 0) {
        const linger wait = {1, 20};
        EXPECT_EQ(setsockopt(lingering.get(), SOL_SOCKET, SO_LINGER, &wait, sizeof wait), 0);
    }
    lingering.reset();
    take(a, {let_go});
    EXPECT_TRUE(wait_taken(a.fd()));
}

// Whether the kernel lets them or not.
TEST_F(hostile_clients, attach_what_nobody_asked_for) {
    const int nulls[253] = {};
    const step descriptors = attach(SCM_RIGHTS, bytes_of(nulls), "EV p n x", EPERM);
    const step itself = [](attack& a) {
        take(a, {attach(SCM_RIGHTS, bytes_of(a.fd()), "EV p n x", EPERM)});
    };
    const std::string million(1000000, '\0');
    withstand({{"-C"}}, {
        {"descriptors", whole, {repeat(300, {descriptors})}},
        {"descriptors on a stream", {framed}, {repeat(300, {descriptors})}, {maybe(incomplete)}},
        {"descriptors behind the header", raw, {"HD 9 IA", descriptors, hang_up},
         {maybe(gone), incomplete}},
        {"its own connection", everywhere, {itself}},
        {"a connection that lingers", everywhere, {attach_lingering}},
        {"something unknown", everywhere, {attach(99, "x", "EV p n x", EINVAL)}},
        {"a million bytes", everywhere, {attach(SCM_CREDENTIALS, million, "EV p n x", ENOBUFS)}},
    });
}

TEST_F(hostile_clients, have_no_permission) {
    if (getuid() != 0) GTEST_SKIP() << "only root can be somebody else";
    const steps privileged = {"FL", "FS", "WC junk", "NC", "GD", "DC 0", "RM 0", "SN 1", "IM 1",
                              "FN 750 0", "FG 750 1"};
    const std::string switching = "W kivd: setDataCollectionEnable (DC) ";
    const std::vector<std::string> denied = {
        "W kivd: flush (FL) ", "W kivd: forceSave (FS) ", "W kivd: notifyNewConfiguration (NC) ",
        "W kivd: writeConfiguration (WC) ", "W kivd: getDeviceId (GD) ", switching,
        "W kivd: removeReport (RM) ", "W kivd: setSerialNumber (SN) ", "W kivd: setImei (IM) ",
        "W kivd: fileIteratorNext (FN) ", "W kivd: fileGet (FG) "};
    std::string replies;
    for (int i = 0; i < 50; ++i) replies += "0-1FAIL";
    const std::string root = bytes_of(ucred{getpid(), 0, 0});
    const std::string init = bytes_of(ucred{1, stranger, stranger});
    const std::string less = bytes_of(ucred{getpid(), stranger, stranger});
    withstand({{"-C"}}, {
        {"all of it", everywhere, {as_stranger({repeat(50, privileged)})}, denied, replies},
        {"refused beyond the buffer", raw, {as_stranger({"HD " + zeros + "2", " FG"})},
         {denied.back()}, "FAIL"},
        {"root's credentials and another's", everywhere,
         {as_stranger({attach(SCM_CREDENTIALS, root, "DC 0", EPERM),
                       attach(SCM_CREDENTIALS, init, "DC 0", EPERM)})}},
        {"less than its own", {datagram}, {attach(SCM_CREDENTIALS, less, "DC 0", 0)}, {switching}},
        {"less, on a connection", connections, {attach(SCM_CREDENTIALS, less, "FN 1 1", 0)}, {},
         "-1"},
        {"ever new group ids", everywhere,
         {as_stranger({repeat(3, {"SG 1", "SG 2", "SG 3", "SG 4", "SG 5", "SG 6", "SG 7"})})}},
    });
}

void storm(attack& a) {
    const std::pair<way, steps> parts[] = {
        {datagram, {flood(20000, "CI storm counter 1")}},
        {datagram, {repeat(2000, {flood(1, "EV storm event " + std::string(1000, 'x')), hang_up})}},
        {packets, {repeat(3000, {"GC storm part", hears("FAIL")})}},
        {packets, {repeat(1000, {flood(1, "IA"), hang_up})}},
        {framed, {flood(10000, "XY"), hang_up}},
        {bytes, {repeat(1000, {arrive, hang_up})}},
    };
    std::vector<std::thread> threads;
    for (const auto& each : parts) {
        threads.emplace_back([&a, &each] {
            attack one{a.daemon, each.first, a.log_start};
            take(one, each.second);
        });
    }
    for (int i = 0; i < 20; ++i) others_are_served(a);
    for (std::thread& each : threads) each.join();
}

TEST_F(hostile_clients, come_in_floods) {
    const step is_saved = [](attack&) {  // with no request any more
        const std::string value = "\000100000\0\0\n"s;
        EXPECT_TRUE(wait_until(
            [&] { return read_file("private/counters.txt").find(value) != std::string::npos; }));
    };
    const std::string shutdown = "EV devicemonitor.powerstat ShutDown " + std::string(30000, 'x');
    withstand({{"-C", "-s", "1"}}, {
        {"counts", {datagram}, {flood(100000, "CI p n 1"), is_saved}},
        {"storm", {packets}, {storm},
         {maybe(bad_xy), maybe(incomplete), maybe(invalid), maybe(too_large), maybe(gone),
          maybe(no_length), maybe(bad_size), maybe("Bad command: "), maybe(unsent),
          maybe(reset)}},
        {"bad packets", whole, {flood(10000, "XY")}, {bad_xy}},
        {"full queue", {datagram}, {hold, repeat(11, {"XY", hang_up}), let_go}, {bad_xy}},
        {"saves", whole, {flood(2000, "FS")}},
        {"flushes", whole, {"EV p n x", repeat(30, {"FL"})}},
        {"deletions", whole, {repeat(30, {"EV p n x", "FL", "RM 0"})}, {maybe(deleted)}},
        {"diagnostics", whole, {"DC 1", flood(100, shutdown), "DC 0", "DC 1"}},
        {"switches", whole, {flood(100, "DC 0"), repeat(50, {"DC 0", "EV p n x", "DC 1"})}},
        {"configurations", whole, {repeat(50, {"WC junk", "NC"})}, {no_unpack},
         std::string(50, '0')},
    });
}

TEST_F(hostile_clients, make_it_remember_all_they_can) {
    const step counters = flood(19000, "CI p n# 1");
    const step values = flood(200, "SD p n# " + std::string(31000, 'x'));
    withstand({{"-C"}}, {
        {"counters", {packets}, {counters}, {}, {}, 4096},
        {"the same counters", whole, {counters}},
        {"values", {packets}, {values}, {}, {}, 8192},
        {"the same values", whole, {values}},
        {"probes asked for", {datagram}, {flood(100000, "PA p n#")}},
        {"events", {datagram}, {flood(50000, "EV p n# x")}},
    });
}

// With room for four MiB more, of which it needs 31.
void take_all_memory(attack& a) {
    size_t pages = 0;
    std::ifstream("/proc/" + std::to_string(a.daemon.pid()) + "/statm") >> pages;
    const rlimit limit = {pages * static_cast<size_t>(getpagesize()) + (4U << 20U), RLIM_INFINITY};
    const rlimit none = {RLIM_INFINITY, RLIM_INFINITY};
    EXPECT_EQ(prlimit(a.daemon.pid(), RLIMIT_AS, &limit, nullptr), 0);
    take(a, {arrive, flood(1000, "SD memory value# " + std::string(31000, 'x')),
             flood(9000, "CI memory counter# 1")});
    for (int i = 0; i < 50; ++i) {  // whether it can take them or not
        (void)ask(connect_client(socket_kind::packets).get(), "IA");
    }
    take(a, {"XY", "IA", hears("1")});
    EXPECT_EQ(prlimit(a.daemon.pid(), RLIMIT_AS, &none, nullptr), 0);
}

TEST_F(hostile_clients, take_all_memory) {
    if (sanitized) GTEST_SKIP() << "a sanitizer would end it";
    withstand({{"-C"}}, {{"with values", {packets}, {take_all_memory},
                          {bad_xy, maybe("W kivd-list: Failed to grow list"),
                           maybe("E kivd-error: KIV daemon error event not created. Failed to")},
                          {}, 6144}});
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
    const uid_t user = getuid() == 0 ? stranger : 0;  // root would have more under way
    ASSERT_EQ(user == 0 ? 0 : chown(".", user, user), 0);
    withstand({{"-C"}, 64, user}, {
        {"connections", {packets}, {take_all_descriptors}, {no_accept}},
        {"a part to ask for", {packets}, {part, "NC"}, {}, "1"},
        {"under way", {packets},
         {flood(100, get_part), is_logged("fd-message"), hang_up, get_part, gets_descriptor},
         {no_part, maybe(reset)}},
    });
}

TEST_F(hostile_clients, do_not_hold_up_its_end) {
    const std::pair<way, steps> cases[] = {
        {bytes, {"HD 9 "}},
        {packets, {flood(500, "IA")}},
        {packets, {flood(500, "GC p n")}},
        {framed, {repeat(300, {"IA", keep})}},
    };
    for (const auto& [via, what] : cases) {
        daemon_process daemon = start();
        attack a{daemon, via, 0};
        take(a, what);
        take(a, {daemon_is_idle});  // since it waits for the client
        daemon.send_signal(SIGTERM);
        EXPECT_EQ(daemon.wait_exit(2500), 0) << daemon.log();  // less than one more reply takes
    }
}

TEST_F(hostile_debug_clients, cost_nothing) {
    const std::string lost = "E kivd-kivddi: Fail to send to socket: ";
    const step debugger = [](attack& a) { a.kept.push_back(connect_debugger()); };
    const step alive = repeat(1, {"IA", hears("1")});  // by now it has been accepted
    const step orders = [](attack& a) {
        EXPECT_TRUE(send_text(a.kept.front().get(), "RM 0 " + largest));
        EXPECT_EQ(send(a.kept.front().get(), "DC 0", 4, MSG_OOB), 4);
    };
    const step sees_event = [](attack& a) {
        std::string seen, more;
        do seen += more = receive_text(a.kept.back().get());
        while (!more.empty() && !seen.ends_with("EV p n x"));
        EXPECT_NE(more, "");
    };
    const step finds_every_frame = [&](attack& a) {
        std::vector<char> all(30U << 20U);
        size_t size = 0;
        for (int i = 0; i < 2; ++i) {
            ssize_t n = 1;
            for (; n > 0; size += static_cast<size_t>(std::max<ssize_t>(n, 0))) {
                n = recv(a.kept.back().get(), &all[size], all.size() - size, MSG_DONTWAIT);
            }
            EXPECT_TRUE(n == 0 || a.has_logged(lost));  // hung up on inside a frame, or at its end
            take(a, {alive});
        }
        uint32_t length = 0;
        for (size_t at = 0; at + 5 <= size; at += 4 + ntohl(length)) {
            memcpy(&length, &all[at], sizeof length);
            ASSERT_EQ(all[at + 4], '\x0a') << at;
        }
    };
    const step events = flood(2000, "EV p n " + std::string(30000, 'x'));
    const std::vector<std::string> perhaps = {maybe(lost)};
    withstand({{"-C", "-d"}}, {
        {"stops reading", {packets}, {debugger, alive, events, alive, finds_every_frame, release},
         perhaps},
        {"gone before the frame", {packets},
         {debugger, alive, hold, "EV p n x", release, let_go}, {lost}},
        {"replaced as it sends", {packets},
         {debugger, alive, hold, debugger, orders, let_go, "EV p n x", sees_event, release},
         perhaps},
        {"gives orders", {packets}, {debugger, alive, orders, daemon_is_idle, release}, perhaps},
        {"in crowds", {packets}, {repeat(50, {debugger, alive}), "EV p n x", sees_event, release},
         perhaps},
        {"gone at once", {packets}, {repeat(50, {debugger, release})}, perhaps},
    });
}
// clang-format on

}  // namespace
}  // namespace kivd
