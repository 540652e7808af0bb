// The check of log messages, which any local user can send.
#include <algorithm>
#include <string_view>

#include "diag/log_message.h"
#include "format/protobuf_message.h"
#include "fuzz/harness.h"
#include "system_logging.pb-c.h"

namespace kivd {
namespace {

constexpr std::string_view kept_tags[] = {"am_anr", "am_crash", "RILJ"};

void check_kept(input_bytes input) {
    const auto message = unpack_message<Kiv__SystemLogging__LogMessage>(
        kiv__system_logging__log_message__descriptor, input);
    require(message != nullptr && message->tag != nullptr, "what is no message is kept");
    require(std::ranges::find(kept_tags, std::string_view(message->tag)) != std::end(kept_tags),
            "a message that nobody wants is kept");
}

}  // namespace
}  // namespace kivd

int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    kivd::suppress_errors();
    if (kivd::is_kept_log_message({reinterpret_cast<const char*>(data), size})) {
        kivd::check_kept({data, size});
    }
    return 0;
}
