// The stream of the debug interface, taken apart. A frame is the length of the rest in four bytes,
// big-endian, then a request packet as field 1 of a protobuf message.
#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

namespace kivd {

// Both are good until bytes are added.
struct debug_frame {
    std::string_view bytes;   // the whole of it
    std::string_view packet;  // the request in it
};

// Holds at most one frame that is not whole yet, beside what was added last.
class frame_reader {
 public:
    // What the stream goes on with.
    void add(std::string_view bytes);

    // The next whole frame; none when bytes are missing or the stream is broken.
    [[nodiscard]] std::optional<debug_frame> next();

    // What came is no frame; nothing behind it can be found any more.
    [[nodiscard]] bool is_broken() const { return is_broken_; }
    // Bytes of a frame are there that is not whole.
    [[nodiscard]] bool is_inside_frame() const { return start_ < data_.size(); }

 private:
    std::string data_;
    size_t start_ = 0;  // of the next frame
    bool is_broken_ = false;
};

}  // namespace kivd
