#include "kivctl/watch_frames.h"

#include <gtest/gtest.h>

#include <vector>

#include "support/scratch_directory.h"

namespace kivd {
namespace {

using namespace std::string_literals;

// What comes of a stream that arrives in pieces of that size.
struct seen {
    std::vector<std::string> packets;
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

// A request of that size in its frame; the sizes are those of the varint's lengths.
const std::string smallest = "\0\0\0\2\x0a\0"s;
const std::string longest_of_one = "\0\0\0\x81\x0a\x7f"s + std::string(127, 'a');
const std::string shortest_of_two = "\0\0\0\x83\x0a\x80\x01"s + std::string(128, 'b');
const std::string largest = "\0\0\x79\xcc\x0a\xc8\xf3\x01"s + std::string(31'176, 'c');

TEST(watch_frames, are_found_however_the_stream_is_cut) {
    const std::string example = doc_example("requests.md", "hex", "debug-frame");
    const std::string stream =
        example + smallest + longest_of_one + shortest_of_two + largest + example;
    const std::vector<std::string> packets = {
        "IA", "", std::string(127, 'a'), std::string(128, 'b'), std::string(31'176, 'c'), "IA"};
    for (const size_t piece : {size_t{1}, size_t{3}, size_t{4}, size_t{5}, stream.size()}) {
        SCOPED_TRACE(piece);
        const seen all = read_in_pieces(stream, piece);
        EXPECT_EQ(all.packets, packets);
        EXPECT_EQ(all.frames, stream);
        EXPECT_FALSE(all.is_broken || all.is_inside_frame);
    }
    for (size_t cut = 1; cut < example.size(); ++cut) {
        SCOPED_TRACE(cut);
        const seen all = read_in_pieces(example + example.substr(0, cut), 2);
        EXPECT_EQ(all.frames, example);
        EXPECT_TRUE(all.is_inside_frame && !all.is_broken);
    }
}

TEST(watch_frames, end_at_the_first_bytes_that_are_none) {
    const std::string good = "\0\0\0\4\x0a\2IA"s;
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
        SCOPED_TRACE(testing::PrintToString(bad));
        for (const size_t piece : {size_t{1}, size_t{100}}) {
            const seen all = read_in_pieces(good + bad + good, piece);
            EXPECT_EQ(all.frames, good);
            EXPECT_TRUE(all.is_broken);
        }
    }
}

}  // namespace
}  // namespace kivd
