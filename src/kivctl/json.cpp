#include "kivctl/json.h"

#include <cstdio>

#include "toolkit/text_escape.h"

namespace kivd {

std::string json(std::string_view text) {
    std::string quoted = "\"";
    for (const char c : escape_non_utf8(text)) {
        if (c == '"' || c == '\\') {
            quoted += {'\\', c};
        } else if (static_cast<unsigned char>(c) < 0x20) {
            char escaped[8];
            snprintf(escaped, sizeof escaped, "\\u%04x", static_cast<unsigned>(c));
            quoted += escaped;
        } else {
            quoted += c;
        }
    }
    return quoted + '"';
}

std::string json_object(std::initializer_list<json_member> members) {
    std::string text;
    for (const auto& [name, value] : members) {
        text += text.empty() ? '{' : ',';
        text += json(name);
        text += ':';
        text += value;
    }
    return text.empty() ? "{}" : text + '}';
}

std::string json_array(std::span<const std::string> values) {
    std::string text;
    for (const std::string& value : values) {
        text += text.empty() ? '[' : ',';
        text += value;
    }
    return text.empty() ? "[]" : text + ']';
}

}  // namespace kivd
