#include "tools/report_printer.h"

#include <google/protobuf/descriptor.h>
#include <google/protobuf/io/zero_copy_stream_impl.h>
#include <google/protobuf/io/zero_copy_stream_impl_lite.h>
#include <google/protobuf/text_format.h>
#include <google/protobuf/util/json_util.h>
#include <google/protobuf/util/type_resolver_util.h>

#include <memory>
#include <stdexcept>
#include <vector>

#include "tools/known_payload.h"
#include "tools/text_escape.h"

namespace kivd {
namespace {

namespace protobuf = google::protobuf;
using protobuf::FieldDescriptor;

constexpr char type_prefix[] = "type.googleapis.com";

// An event, and what its payload is when that is known.
class event_printer : public protobuf::TextFormat::MessagePrinter {
 public:
    void Print(const protobuf::Message& message, bool /*single_line_mode*/,
               protobuf::TextFormat::BaseTextGenerator* generator) const override {
        std::string text;
        (void)protobuf::TextFormat::PrintToString(message, &text);
        const std::string known = known_payload_text(static_cast<const kiv::Event&>(message));
        if (!known.empty()) text += "# " + known + '\n';
        generator->PrintString(text);
    }
};

void escape_strings(protobuf::Message& message);

void escape_field(protobuf::Message& message, const FieldDescriptor* field) {
    const auto* reflection = message.GetReflection();
    const bool is_string = field->type() == FieldDescriptor::TYPE_STRING;
    const bool is_message = field->type() == FieldDescriptor::TYPE_MESSAGE;
    if (field->is_repeated()) {
        for (int i = 0; i < reflection->FieldSize(message, field); ++i) {
            if (is_message) escape_strings(*reflection->MutableRepeatedMessage(&message, field, i));
            if (!is_string) continue;
            const std::string text = reflection->GetRepeatedString(message, field, i);
            reflection->SetRepeatedString(&message, field, i, escape_non_utf8(text));
        }
        return;
    }
    if (is_message) escape_strings(*reflection->MutableMessage(&message, field));
    if (!is_string) return;
    const std::string text = reflection->GetString(message, field);
    reflection->SetString(&message, field, escape_non_utf8(text));
}

void escape_strings(protobuf::Message& message) {
    std::vector<const FieldDescriptor*> fields;
    message.GetReflection()->ListFields(message, &fields);
    for (const FieldDescriptor* field : fields) escape_field(message, field);
}

}  // namespace

void print_text(std::ostream& out, const std::string& path, const kiv::Report& report) {
    out << "# " << printable(path) << '\n';
    protobuf::io::OstreamOutputStream stream(&out);
    protobuf::TextFormat::Printer printer;
    auto for_events = std::make_unique<event_printer>();
    if (printer.RegisterMessagePrinter(kiv::Event::descriptor(), for_events.get())) {
        (void)for_events.release();  // the printer's now
    }
    if (!printer.Print(report, &stream)) out.setstate(std::ios::failbit);
}

void print_json(std::ostream& out, const kiv::Report& report) {
    kiv::Report escaped = report;
    escape_strings(escaped);
    // Partial, because the records of a torn file may lack the header.
    const std::string bytes = escaped.SerializePartialAsString();

    protobuf::util::JsonPrintOptions options;
    options.add_whitespace = true;
    options.preserve_proto_field_names = true;
    const std::unique_ptr<protobuf::util::TypeResolver> resolver(
        protobuf::util::NewTypeResolverForDescriptorPool(
            type_prefix, protobuf::DescriptorPool::generated_pool()));
    protobuf::io::ArrayInputStream input(bytes.data(), static_cast<int>(bytes.size()));
    protobuf::io::OstreamOutputStream stream(&out);
    const auto status = protobuf::util::BinaryToJsonStream(
        resolver.get(), std::string(type_prefix) + "/" + escaped.GetTypeName(), &input, &stream,
        options);
    if (!status.ok()) throw std::runtime_error("cannot be put as JSON: " + status.ToString());
}

}  // namespace kivd
