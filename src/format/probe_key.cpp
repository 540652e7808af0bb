#include "format/probe_key.h"

#include <cstdlib>
#include <cstring>

namespace kivd {

int compare_probes(const void* key, const void* element) {
    const auto& wanted = *static_cast<const probe_key*>(key);
    const auto& present = *static_cast<const probe_key*>(element);
    const int order = strcmp(wanted.package, present.package);
    return order != 0 ? order : strcmp(wanted.name, present.name);
}

void* new_probe_element(size_t fixed_size, const probe_key& key) {
    const size_t package_size = strlen(key.package) + 1;
    const size_t name_size = strlen(key.name) + 1;
    void* const block = malloc(fixed_size + package_size + name_size);
    if (block == nullptr) return nullptr;
    char* const texts = static_cast<char*>(block) + fixed_size;
    memcpy(texts, key.package, package_size);
    memcpy(texts + package_size, key.name, name_size);
    *static_cast<probe_key*>(block) = {texts, texts + package_size};
    return block;
}

}  // namespace kivd
