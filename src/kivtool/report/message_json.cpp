#include "kivtool/report/message_json.h"

#include <google/protobuf/descriptor.h>
#include <openssl/evp.h>

#include <cstdint>
#include <string>
#include <vector>

#include "util/bytes.h"

namespace kivd {
namespace {

using google::protobuf::FieldDescriptor;
using google::protobuf::Message;
using google::protobuf::Reflection;

constexpr int no_list = -1;

std::string base64(const std::string& bytes) {
    std::string text((bytes.size() + 2) / 3 * 4 + 1, '\0');  // with its NUL
    const int size = EVP_EncodeBlock(reinterpret_cast<uint8_t*>(text.data()),
                                     bytes_of(bytes).data(), static_cast<int>(bytes.size()));
    text.resize(static_cast<size_t>(size));
    return text;
}

// The value of a field, or of the element at `index` of a repeated one.
json value_of(const Message& message, const FieldDescriptor& field, int index) {
    const Reflection& all = *message.GetReflection();
    const auto get = [&](auto of_field, auto of_list) -> decltype(auto) {
        return index == no_list ? (all.*of_field)(message, &field)
                                : (all.*of_list)(message, &field, index);
    };
    switch (field.cpp_type()) {
        case FieldDescriptor::CPPTYPE_INT32:
            return get(&Reflection::GetInt32, &Reflection::GetRepeatedInt32);
        case FieldDescriptor::CPPTYPE_UINT32:
            return get(&Reflection::GetUInt32, &Reflection::GetRepeatedUInt32);
        case FieldDescriptor::CPPTYPE_INT64:
            return std::to_string(get(&Reflection::GetInt64, &Reflection::GetRepeatedInt64));
        case FieldDescriptor::CPPTYPE_BOOL:
            return get(&Reflection::GetBool, &Reflection::GetRepeatedBool);
        case FieldDescriptor::CPPTYPE_ENUM:
            return get(&Reflection::GetEnum, &Reflection::GetRepeatedEnum)->name();
        case FieldDescriptor::CPPTYPE_STRING: {
            const std::string text = get(&Reflection::GetString, &Reflection::GetRepeatedString);
            if (field.type() == FieldDescriptor::TYPE_BYTES) return base64(text);
            return json_text(text);
        }
        case FieldDescriptor::CPPTYPE_MESSAGE: {
            json object = json::object();
            add_fields(object, index == no_list ? all.GetMessage(message, &field)
                                                : all.GetRepeatedMessage(message, &field, index));
            return object;
        }
        default:  // no schema here has any other type
            return nullptr;
    }
}

}  // namespace

json field_json(const Message& message, const FieldDescriptor& field) {
    return value_of(message, field, no_list);
}

void add_fields(json& object, const Message& message) {
    const Reflection& all = *message.GetReflection();
    std::vector<const FieldDescriptor*> fields;
    all.ListFields(message, &fields);
    for (const FieldDescriptor* field : fields) {
        json& member = object[field->name()];
        if (!field->is_repeated()) {
            member = value_of(message, *field, no_list);
            continue;
        }
        for (int i = 0; i < all.FieldSize(message, field); ++i) {
            member.push_back(value_of(message, *field, i));
        }
    }
}

}  // namespace kivd
