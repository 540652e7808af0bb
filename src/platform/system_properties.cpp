#include "platform/system_properties.h"

#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "util/unique_fd.h"

namespace kivd {
namespace {

// "key=value" lines; those that start with # are comments. An empty value is none.
bool find_in_file(const char* path, const char* key, char* value) {
    const unique_file file(fopen(path, "re"));
    if (!file) return false;
    const size_t key_length = strlen(key);
    char* line = nullptr;
    size_t capacity = 0;
    int length = 0;
    while (length == 0 && getline(&line, &capacity, file.get()) >= 0) {
        if (line[0] == '#') continue;
        if (strncmp(line, key, key_length) != 0 || line[key_length] != '=') continue;
        const char* const text = line + key_length + 1;
        length = static_cast<int>(strcspn(text, "\r\n"));
        snprintf(value, PROPERTY_VALUE_MAX, "%.*s", length, text);
    }
    free(line);
    return length > 0;
}

}  // namespace

extern "C" int property_get(const char* key, char* value, const char* default_value) {
    for (const char* path :
         {"/system/build.prop", "/vendor/build.prop", "/data/property/persist.prop"}) {
        if (find_in_file(path, key, value)) return static_cast<int>(strlen(value));
    }
    return snprintf(value, PROPERTY_VALUE_MAX, "%s", default_value);
}

}  // namespace kivd
