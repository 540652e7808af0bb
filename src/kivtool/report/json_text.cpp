#include "kivtool/report/json_text.h"

#include <google/protobuf/descriptor.h>

#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <vector>

#include "toolkit/text_escape.h"

namespace kivd {
namespace {

using google::protobuf::FieldDescriptor;
using google::protobuf::Message;

constexpr int no_list = -1;

void append_base64(std::string& to, std::string_view bytes) {
    constexpr char digits[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
    for (size_t i = 0; i < bytes.size(); i += 3) {
        const size_t size = std::min<size_t>(bytes.size() - i, 3);
        uint32_t bits = 0;
        for (size_t k = 0; k < 3; ++k) {
            bits = bits << 8 | (k < size ? static_cast<uint8_t>(bytes[i + k]) : 0u);
        }
        for (size_t k = 0; k < 4; ++k) to += k <= size ? digits[bits >> (18 - 6 * k) & 63] : '=';
    }
}

// The value of a field, or the one at `index` of a list.
void append_value(std::string& to, const Message& message, const FieldDescriptor& field,
                  int index) {
    const auto* all = message.GetReflection();
    const bool alone = index == no_list;
    std::string space;
    switch (field.cpp_type()) {
        case FieldDescriptor::CPPTYPE_INT32:
            to += std::to_string(alone ? all->GetInt32(message, &field)
                                       : all->GetRepeatedInt32(message, &field, index));
            return;
        case FieldDescriptor::CPPTYPE_UINT32:
            to += std::to_string(alone ? all->GetUInt32(message, &field)
                                       : all->GetRepeatedUInt32(message, &field, index));
            return;
        case FieldDescriptor::CPPTYPE_INT64:
            to += '"';
            to += std::to_string(alone ? all->GetInt64(message, &field)
                                       : all->GetRepeatedInt64(message, &field, index));
            to += '"';
            return;
        case FieldDescriptor::CPPTYPE_BOOL:
            to += (alone ? all->GetBool(message, &field)
                         : all->GetRepeatedBool(message, &field, index))
                      ? "true"
                      : "false";
            return;
        case FieldDescriptor::CPPTYPE_ENUM:
            append_json_string(to, (alone ? all->GetEnum(message, &field)
                                          : all->GetRepeatedEnum(message, &field, index))
                                       ->name());
            return;
        case FieldDescriptor::CPPTYPE_STRING: {
            const std::string& text =
                alone ? all->GetStringReference(message, &field, &space)
                      : all->GetRepeatedStringReference(message, &field, index, &space);
            if (field.type() == FieldDescriptor::TYPE_STRING) return append_json_string(to, text);
            to += '"';
            append_base64(to, text);
            to += '"';
            return;
        }
        case FieldDescriptor::CPPTYPE_MESSAGE:
            to += '{';
            append_json_fields(to, alone ? all->GetMessage(message, &field)
                                         : all->GetRepeatedMessage(message, &field, index));
            to += '}';
            return;
        default:  // of no schema here
            to += "null";
    }
}

void append_list(std::string& to, const Message& message, const FieldDescriptor& field) {
    const int size = message.GetReflection()->FieldSize(message, &field);
    to += '[';
    for (int i = 0; i < size; ++i) {
        if (i > 0) to += ',';
        append_value(to, message, field, i);
    }
    to += ']';
}

}  // namespace

void append_json_string(std::string& to, std::string_view text) {
    to += '"';
    for (const char character : escape_non_utf8(text)) {
        if (character == '"' || character == '\\') {
            to += '\\';
            to += character;
        } else if (static_cast<uint8_t>(character) < 0x20) {
            char escaped[8];
            snprintf(escaped, sizeof escaped, "\\u%04x", static_cast<unsigned>(character));
            to += escaped;
        } else {
            to += character;
        }
    }
    to += '"';
}

void append_json_fields(std::string& to, const Message& message) {
    std::vector<const FieldDescriptor*> fields;
    message.GetReflection()->ListFields(message, &fields);
    bool is_first = true;
    for (const FieldDescriptor* field : fields) {
        if (!is_first) to += ',';
        is_first = false;
        to += '"';
        to += field->name();
        to += "\":";
        if (field->is_repeated()) {
            append_list(to, message, *field);
        } else {
            append_value(to, message, *field, no_list);
        }
    }
}

void append_json_value(std::string& to, const Message& message, const FieldDescriptor& field) {
    append_value(to, message, field, no_list);
}

}  // namespace kivd
