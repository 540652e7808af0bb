#include "kivtool/report/known_payload.h"

#include <google/protobuf/text_format.h>

#include <algorithm>
#include <iterator>
#include <memory>
#include <string_view>

#include "daemon_error.pb.h"
#include "kernel.pb.h"
#include "system_logging.pb.h"

namespace kivd {
namespace {

using google::protobuf::Message;

template <class type>
const Message& empty() {
    return type::default_instance();
}

constexpr struct {
    std::string_view package, name;
    const Message& (*message)();
} known_kinds[] = {
    {"kiv", "DaemonError", empty<kiv::DaemonError>},
    {"kernel", "ProcessKill", empty<kernel::ProcessKill>},
    {"kiv.system_logging", "LogMessage", empty<kiv::system_logging::LogMessage>},
};

const auto* find_kind(const kiv::Event& event) {
    return std::ranges::find_if(known_kinds, [&event](const auto& each) {
        return each.package == event.package() && each.name == event.name();
    });
}

}  // namespace

bool is_of_known_kind(const kiv::Event& event) { return find_kind(event) != std::end(known_kinds); }

std::string one_line(const Message& message) {
    google::protobuf::TextFormat::Printer printer;
    printer.SetSingleLineMode(true);
    std::string text;
    (void)printer.PrintToString(message, &text);
    return text;
}

std::string known_payload_text(const kiv::Event& event) {
    const auto* const kind = find_kind(event);
    if (kind == std::end(known_kinds)) return "";
    const std::unique_ptr<Message> message(kind->message().New());
    if (!message->ParseFromString(event.payload())) return "";
    return message->GetTypeName() + " { " + one_line(*message) + "}";
}

}  // namespace kivd
