#include "kivtool/config/part_text.h"

#include <google/protobuf/descriptor.h>
#include <google/protobuf/io/tokenizer.h>

#include <algorithm>
#include <iterator>
#include <memory>
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

// Both count from 0, as protobuf does.
std::string located(int line, int column, const std::string& reason) {
    return std::to_string(line + 1) + ":" + std::to_string(column + 1) + ": " + printable(reason);
}

// Keeps the first error: those behind it are often its consequences.
class first_error : public protobuf::io::ErrorCollector {
 public:
    void AddError(int line, protobuf::io::ColumnNumber column,
                  const std::string& message) override {
        if (text.empty()) text = located(line, column, message);
    }

    std::string text;
};

// The name of the first required field that is absent in `message` itself; empty when all are
// there.
std::string absent_field(const Message& message) {
    for (int i = 0; i < message.GetDescriptor()->field_count(); ++i) {
        const FieldDescriptor* field = message.GetDescriptor()->field(i);
        if (field->is_required() && !message.GetReflection()->HasField(message, field)) {
            return field->name();
        }
    }
    return "";
}

// Finds the first message in `message` that is not complete. `locations` says where each was read,
// but of messages in a list in brackets only where the list is; `start` is where `message` was.
std::string find_incomplete(const Message& message, const TextFormat::ParseInfoTree* locations,
                            TextFormat::ParseLocation start) {
    const std::string absent = absent_field(message);
    if (!absent.empty()) {
        return located(start.line, start.column,
                       message.GetTypeName() + " lacks \"" + absent + "\"");
    }
    const auto* reflection = message.GetReflection();
    std::vector<const FieldDescriptor*> fields;
    reflection->ListFields(message, &fields);
    for (const FieldDescriptor* field : fields) {
        if (field->cpp_type() != FieldDescriptor::CPPTYPE_MESSAGE) continue;
        const int size = field->is_repeated() ? reflection->FieldSize(message, field) : 1;
        for (int i = 0; i < size; ++i) {
            const int index = field->is_repeated() ? i : -1;  // as the tree wants it
            const Message& inner = field->is_repeated()
                                       ? reflection->GetRepeatedMessage(message, field, i)
                                       : reflection->GetMessage(message, field);
            if (inner.IsInitialized()) continue;
            if (!locations) return find_incomplete(inner, nullptr, start);
            const auto location = locations->GetLocation(field, index);
            return find_incomplete(inner, locations->GetTreeForNested(field, index),
                                   location.line < 0 ? start : location);
        }
    }
    return "";
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
    parser.AllowPartialMessage(true);  // the parser itself cannot say where a field is missing
    if (!parser.ParseFromString(text, message.get())) return error.text;
    payload = message->SerializePartialAsString();
    return find_incomplete(*message, &places, {0, 0});
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
