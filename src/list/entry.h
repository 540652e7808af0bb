// Entries of lists: a type of the owner's that begins with (derives from) a probe_key, in one block
// of malloc with the two texts behind it.
#pragma once

#include <cstdlib>
#include <cstring>
#include <memory>
#include <new>
#include <utility>

#include "format/probe_key.h"

namespace kivd {

template <class entry>
struct entry_releaser {
    void operator()(entry* released) const noexcept {
        released->~entry();
        free(released);
    }
};
template <class entry>
using unique_entry = std::unique_ptr<entry, entry_releaser<entry>>;

// A new entry with copies of the texts of `key`, and of its other members in their order. Null when
// there is no memory.
template <class entry, class... members>
[[nodiscard]] unique_entry<entry> make_entry(const probe_key& key, members&&... values) {
    const size_t package_size = strlen(key.package) + 1;
    const size_t name_size = strlen(key.name) + 1;
    void* const block = malloc(sizeof(entry) + package_size + name_size);
    if (block == nullptr) return nullptr;
    char* const texts = static_cast<char*>(block) + sizeof(entry);
    memcpy(texts, key.package, package_size);
    memcpy(texts + package_size, key.name, name_size);
    return unique_entry<entry>(
        new (block) entry{{texts, texts + package_size}, std::forward<members>(values)...});
}

}  // namespace kivd
