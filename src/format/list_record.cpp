#include "format/list_record.h"

#include <algorithm>
#include <cstring>

namespace kivd {

std::optional<std::string_view> first_list_record(std::string_view bytes) {
    bytes = bytes.substr(0, list_record_size_max);
    const void* const end =
        memmem(bytes.data(), bytes.size(), list_record_end.data(), list_record_end.size());
    if (end == nullptr) return std::nullopt;
    return bytes.substr(0, static_cast<size_t>(static_cast<const char*>(end) - bytes.data()));
}

bool split_list_record(std::string_view record, std::span<const char*> fields) {
    const char* const end = record.data() + record.size();
    std::ranges::fill(fields, nullptr);
    const char* next = record.data();
    for (size_t i = 0; i < fields.size(); ++i) {
        if (i > 0 && next >= end) return false;
        fields[i] = next;
        next += strlen(next) + 1;
    }
    return next == end + 1;
}

}  // namespace kivd
