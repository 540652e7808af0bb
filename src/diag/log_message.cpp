#include "diag/log_message.h"

#include <algorithm>
#include <cstring>
#include <iterator>
#include <optional>
#include <string_view>

#include "format/varint.h"
#include "runtime/log_and_raise.h"
#include "system_logging.pb-c.h"
#include "util/protobuf_message.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-qz";
constexpr int max_depth = 64;

struct kept_tag {
    std::string_view name;
    const char* wanted_text;  // has to be in the message; null: nothing has to
};
constexpr kept_tag kept_tags[] = {
    {"am_anr", nullptr},
    {"am_crash", nullptr},
    {"RILJ", "< LAST_CALL_FAIL_CAUSE"},
};

enum wire_type : uint32_t { varint = 0, fixed64 = 1, length_delimited = 2, fixed32 = 5 };

// The field in which a message `depth` levels down holds the next: a LogMessage its List, a List
// its Fields, a Field another List.
constexpr uint32_t nesting_field(int depth) {
    if (depth == 0) return 9;
    return depth % 2 == 1 ? 1 : 4;
}

using bytes = std::span<const uint8_t>;

std::optional<bytes> take_bytes(bytes& rest, size_t size) {
    if (size > rest.size()) return std::nullopt;
    const bytes taken = rest.first(size);
    rest = rest.subspan(size);
    return taken;
}

// The content of one field whose key has been taken.
std::optional<bytes> take_content(bytes& rest, uint32_t type) {
    switch (type) {
        case varint:
            return take_varint(rest, max_varint64_size) ? std::optional<bytes>(bytes())
                                                        : std::nullopt;
        case fixed64:
            return take_bytes(rest, 8);
        case fixed32:
            return take_bytes(rest, 4);
        case length_delimited:
            if (const auto size = take_varint(rest, max_varint32_size)) {
                return take_bytes(rest, static_cast<uint32_t>(*size));
            }
            return std::nullopt;
        default:
            return std::nullopt;
    }
}

// Whether the message consists of whole fields and is not nested too deep. The decoder calls itself
// for each level, however many there are: a small payload could overflow the stack.
bool is_decodable(bytes message, int depth) {
    if (depth > max_depth) return false;
    while (!message.empty()) {
        const auto key = take_varint(message, max_varint32_size);
        if (!key) return false;
        const auto type = static_cast<uint32_t>(*key & 7U);
        const auto content = take_content(message, type);
        if (!content) return false;
        const bool nested =
            type == length_delimited && static_cast<uint32_t>(*key >> 3U) == nesting_field(depth);
        if (nested && !is_decodable(*content, depth + 1)) return false;
    }
    return true;
}

}  // namespace

bool is_kept_log_message(std::span<const char> payload) {
    const bytes encoded(reinterpret_cast<const uint8_t*>(payload.data()), payload.size());
    const auto message =
        is_decodable(encoded, 0)
            ? unpack_message<kiv__system_logging__log_message__unpack,
                             kiv__system_logging__log_message__free_unpacked>(encoded)
            : nullptr;
    if (!message || message->tag == nullptr) {
        return log_and_raise(tag, "Failed to unpack protobuf LogMessage");
    }
    const auto* const kept =
        std::ranges::find(kept_tags, std::string_view(message->tag), &kept_tag::name);
    if (kept == std::end(kept_tags)) return false;
    if (kept->wanted_text == nullptr) return true;
    return message->msg != nullptr && strstr(message->msg, kept->wanted_text) != nullptr;
}

}  // namespace kivd
