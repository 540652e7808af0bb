// What `kivctl watch` finds in the stream of the debug interface, and shows of it.
#include <gtest/gtest.h>

#include "kivctl/watch_frames.h"
#include "kivctl/watch_line.h"
#include "support/scratch_directory.h"

namespace kivd {
namespace {

// What comes of a stream that arrives in pieces of that size.
struct seen {
    lines packets;
    std::string frames;
    bool is_broken, is_inside_frame;
};
seen read_in_pieces(const std::string& stream, size_t piece) {
    frame_reader reader;
    seen all;
    for (size_t at = 0; at < stream.size(); at += piece) {
        reader.add(std::string_view(stream).substr(at, piece));
        while (const auto frame = reader.next()) {
            all.packets.emplace_back(frame->packet);
            all.frames += frame->bytes;
        }
    }
    all.is_broken = reader.is_broken();
    all.is_inside_frame = reader.is_inside_frame();
    return all;
}

TEST(watch, finds_frames_however_the_stream_is_cut) {
    const std::string a(127, 'a'), b(128, 'b'), c(31'176, 'c');  // about the varint's lengths
    const std::string example = doc_example("requests.md", "hex", "debug-frame");
    const std::string stream = example + "\0\0\0\2\x0a\0"s + "\0\0\0\x81\x0a\x7f"s + a +
                               "\0\0\0\x83\x0a\x80\x01"s + b + "\0\0\x79\xcc\x0a\xc8\xf3\x01"s + c +
                               example;
    for (const size_t piece : {size_t{1}, size_t{3}, size_t{4}, size_t{5}, stream.size()}) {
        const seen all = read_in_pieces(stream, piece);
        EXPECT_EQ(all.packets, lines({"IA", "", a, b, c, "IA"})) << piece;
        EXPECT_EQ(all.frames, stream);
        EXPECT_FALSE(all.is_broken || all.is_inside_frame);
    }
    for (size_t cut = 1; cut < example.size(); ++cut) {
        const seen all = read_in_pieces(example + example.substr(0, cut), 2);
        EXPECT_EQ(all.frames, example) << cut;
        EXPECT_TRUE(all.is_inside_frame && !all.is_broken);
    }
    for (const std::string& bad : {
             "\0\0\0\0"s,                                           // no message at all
             "\0\0\0\1\x0a"s,                                       // no length
             "\0\0\x79\xcd\x0a\xc9\xf3\x01"s,                       // one more than the largest
             "\xff\xff\xff\xff"s, "HTTP/1.1 400 Bad Request\r\n"s,  // told at once, not waited for
             "\0\0\0\4\x12\2IA"s,                                   // another field
             "\0\0\0\4\x0a\1IA"s,                                   // bytes behind the packet
             "\0\0\0\4\x0a\3IA"s,                                   // a packet beyond the message
             "\0\0\0\4\x0a\x82\x80\x80"s,                           // a length without an end
         }) {
        for (const size_t piece : {size_t{1}, size_t{100}}) {
            const seen all = read_in_pieces(example + bad + example, piece);
            EXPECT_EQ(all.frames, example) << testing::PrintToString(bad);
            EXPECT_TRUE(all.is_broken);
        }
    }
}

TEST(watch, says_what_the_daemon_reads_in_a_packet) {
    const auto documented = [](const char* name) {
        return doc_example("requests.md", "hex", name);
    };
    const std::string hex_32 = "FF FF FF FF FF FF FF FF FF FF FF FF FF FF FF FF ";
    const std::string event = "EV p n ", x120(120, 'x'), ff32(32, '\xff');
    const struct {
        std::string packet, line, package;
    } cases[] = {
        {documented("event-request"), "   15  EV  app start  2 bytes: 01 FF", "app"},
        {documented("event-request-leading-blank"), "   17  EV  app start  4 bytes: \" abc\"",
         "app"},
        {documented("counter-request"), "   16  CI  app starts  -2", "app"},
        {documented("static-data-request"), "   23  SD  app mode  11 bytes: \"night, auto\"",
         "app"},
        {documented("write-configuration-request"), "    6  WC  3 bytes: 12 01 00", ""},
        {event, "    7  EV  p n  0 bytes", "p"},
        {"EV p n\0a b"s, "   10  EV  p n  3 bytes: \"a b\"", "p"},
        {"EV", "    2  EV  0 bytes", ""},
        {"\t EV\rp\n\nn\t\tx", "   12  EV  p n  2 bytes: \"\\x09x\"", "p"},
        {"SD p n a  b\0c"s, "   13  SD  p n  4 bytes: \"a  b\"", "p"},
        {"CS p n \t7 8", "   11  CS  p n  7 8", "p"},
        {"IA\0x"s, "    4  IA", ""},
        {"", "    0  ??  0 bytes", ""},
        {"IAA p", "    5  ??  5 bytes: \"IAA p\"", ""},
        {"\xff\0"s, "    2  ??  2 bytes: FF 00", ""},
        {event + "\xc3\xbc\\", "   10  EV  p n  3 bytes: \"\xc3\xbc\\\\\"", "p"},
        {event + "a\x1b[31m", "   13  EV  p n  6 bytes: 61 1B 5B 33 31 6D", "p"},
        {event + "\xc2\x9b", "    9  EV  p n  2 bytes: \"\\xC2\\x9B\"", "p"},
        {"EV \x1b[31m \x9b x", "   12  EV  \\x1B[31m \\x9B  1 bytes: \"x\"", "\x1b[31m"},
        {"SG \x1b]0;x\x07", "    9  SG  \\x1B]0;x\\x07", ""},
        {event + x120, "  127  EV  p n  120 bytes: \"" + x120 + '"', "p"},
        {event + x120 + "x", "  128  EV  p n  121 bytes: \"" + x120 + "...\"", "p"},
        {event + ff32, "   39  EV  p n  32 bytes: " + hex_32 + hex_32.substr(0, 47), "p"},
        {event + ff32 + "\xff", "   40  EV  p n  33 bytes: " + hex_32 + hex_32 + "...", "p"},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(testing::PrintToString(c.packet.substr(0, 100)));
        EXPECT_EQ(describe_request(c.packet), c.line);
        EXPECT_EQ(package_of(c.packet), c.package);
    }
}

}  // namespace
}  // namespace kivd
