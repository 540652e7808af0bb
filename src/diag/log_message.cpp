#include "diag/log_message.h"

#include <algorithm>
#include <cstring>
#include <iterator>
#include <string_view>

#include "format/protobuf_message.h"
#include "runtime/log_and_raise.h"
#include "system_logging.pb-c.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-qz";

struct kept_tag {
    std::string_view name;
    const char* wanted_text;  // has to be in the message; null: nothing has to
};
constexpr kept_tag kept_tags[] = {
    {"am_anr", nullptr},
    {"am_crash", nullptr},
    {"RILJ", "< LAST_CALL_FAIL_CAUSE"},
};

}  // namespace

bool is_kept_log_message(std::span<const char> payload) {
    const auto message = unpack_message<Kiv__SystemLogging__LogMessage>(
        kiv__system_logging__log_message__descriptor,
        {reinterpret_cast<const uint8_t*>(payload.data()), payload.size()});
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
