#include "toolkit/json.h"

#include "toolkit/text_escape.h"

namespace kivd {

json json_text(std::string_view text) { return escape_non_utf8(text); }

json json_or_null(const std::optional<std::string>& text) {
    return text ? json_text(*text) : json();
}

}  // namespace kivd
