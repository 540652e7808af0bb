#include "kivtool/config/part_text.h"

#include <google/protobuf/descriptor.h>
#include <google/protobuf/io/tokenizer.h>

#include <algorithm>
#include <iterator>
#include <memory>
#include <sstream>
#include <vector>

#include "config.pb.h"
#include "settings.pb.h"
#include "toolkit/text_escape.h"

namespace kivd {
namespace {

namespace protobuf = google::protobuf;
using protobuf::FieldDescriptor;
using protobuf::Message;
using protobuf::TextFormat;

constexpr int indent_level = 2;

template <class message>
const Message& type_of() {
    return message::default_instance();
}

constexpr daemon_part all_daemon_parts[] = {
    {"FilterConfig", type_of<kiv::config::FilterConfig>},
    {"Settings", type_of<Settings>},
    {"RunActions", type_of<RunActions>},
    {"RunActionsOnce", type_of<RunActionsOnce>},
};

// `line` and `column` count from 0, as in protobuf.
std::string located(int line, int column, const std::string& reason) {
    return std::to_string(line + 1) + ":" + std::to_string(column + 1) + ": " + printable(reason);
}

// Keeps the first error: later ones often follow from it.
class first_error : public protobuf::io::ErrorCollector {
 public:
    void AddError(int line, protobuf::io::ColumnNumber column,
                  const std::string& message) override {
        if (text.empty()) text = located(line, column, message);
    }

    std::string text;
};

// Says where the first required field is missing; empty when `message` is complete. An element of a
// list in brackets is located at the list.
std::string find_absent_field(const Message& message, const TextFormat::ParseInfoTree* places) {
    std::vector<std::string> absent;
    message.FindInitializationErrors(&absent);
    if (absent.empty()) return "";
    const protobuf::Descriptor* type = message.GetDescriptor();
    TextFormat::ParseLocation location(0, 0);
    std::istringstream path(absent.front());  // such as "event_filter.item[1].name"
    std::string step;
    while (std::getline(path, step, '.') && !path.eof()) {
        const size_t bracket = step.find('[');
        const FieldDescriptor* field = type->FindFieldByName(step.substr(0, bracket));
        const int index = bracket == std::string::npos ? -1 : std::stoi(step.substr(bracket + 1));
        if (places) {
            const auto inner = places->GetLocation(field, index);
            if (inner.line >= 0) location = inner;
            places = places->GetTreeForNested(field, index);
        }
        type = field->message_type();
    }
    return located(location.line, location.column, type->full_name() + " lacks \"" + step + "\"");
}

}  // namespace

std::span<const daemon_part> daemon_parts() { return all_daemon_parts; }

const Message* daemon_part_type(std::string_view package, std::string_view name) {
    if (package != daemon_package) return nullptr;
    const auto* found = std::ranges::find(all_daemon_parts, name, &daemon_part::name);
    return found == std::end(all_daemon_parts) ? nullptr : &found->type();
}

std::string encode_part(const Message& type, const std::string& text, std::string& payload,
                        TextFormat::ParseInfoTree& places) {
    const std::unique_ptr<Message> message(type.New());
    first_error error;
    TextFormat::Parser parser;
    parser.RecordErrorsTo(&error);
    parser.WriteLocationsTo(&places);
    parser.AllowPartialMessage(true);  // the parser could not say where a field is missing
    if (!parser.ParseFromString(text, message.get())) return error.text;
    payload = message->SerializePartialAsString();
    return find_absent_field(*message, &places);
}

std::string decode_part(const Message& type, const std::string& payload, std::string& text) {
    const std::unique_ptr<Message> message(type.New());
    const bool is_whole = message->ParsePartialFromString(payload);
    TextFormat::Printer printer;
    printer.SetInitialIndentLevel(indent_level);
    if (!is_whole || !printer.PrintToString(*message, &text)) {
        return "cannot be decoded as " + message->GetTypeName();
    }
    if (message->IsInitialized()) return "";
    return "lacks " + message->InitializationErrorString();
}

}  // namespace kivd
