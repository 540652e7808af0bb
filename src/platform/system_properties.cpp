#include "platform/system_properties.h"

#include <cstdio>
#include <cstring>
#include <memory>

namespace kivd {
namespace {

struct close_file {
    void operator()(FILE* file) const { fclose(file); }
};

// "key=value" lines; those that start with # are comments.
bool find_in_file(const char* path, const char* key, char* value) {
    const std::unique_ptr<FILE, close_file> file(fopen(path, "re"));
    if (!file) return false;
    const size_t key_length = strlen(key);
    char line[1024];
    while (fgets(line, sizeof line, file.get()) != nullptr) {
        if (line[0] == '#') continue;
        if (strncmp(line, key, key_length) != 0 || line[key_length] != '=') continue;
        const char* text = line + key_length + 1;
        snprintf(value, PROPERTY_VALUE_MAX, "%.*s", static_cast<int>(strcspn(text, "\r\n")), text);
        return true;
    }
    return false;
}

}  // namespace
}  // namespace kivd

int property_get(const char* key, char* value, const char* default_value) {
    for (const char* path :
         {"/system/build.prop", "/vendor/build.prop", "/data/property/persist.prop"}) {
        if (kivd::find_in_file(path, key, value)) return static_cast<int>(strlen(value));
    }
    return snprintf(value, PROPERTY_VALUE_MAX, "%s", default_value);
}
