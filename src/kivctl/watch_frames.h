// Splits the stream of the debug interface into frames: the length of the rest in four bytes,
// big-endian, then a request packet as field 1 of a protobuf message.
#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

namespace kivd {

// Both are valid until bytes are added.
struct debug_frame {
    std::string_view bytes;   // the whole of it
    std::string_view packet;  // the request in it
};

// Holds at most one incomplete frame beside what was added last.
class frame_reader {
 public:
    // Takes the next bytes of the stream.
    void add(std::string_view bytes);

    // The next frame; nothing when it is incomplete or the stream is broken.
    [[nodiscard]] std::optional<debug_frame> next();

    // Bytes that are no frame have come; the next frame cannot be found any more.
    [[nodiscard]] bool is_broken() const { return is_broken_; }
    // There are bytes of an incomplete frame.
    [[nodiscard]] bool is_inside_frame() const { return start_ < data_.size(); }

 private:
    std::string data_;
    size_t start_ = 0;  // of the next frame
    bool is_broken_ = false;
};

}  // namespace kivd
