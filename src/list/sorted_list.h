// A growable array of pointers to heap elements, in ascending order by the owner's comparison.
// Elements are never removed one by one: an owner that needs another set builds a new list.
#pragma once

#include <cstdint>

#include "list/probe_index.h"

namespace kivd {

struct sorted_list {
    void** elements;  // each a block of malloc, owned by the list
    uint32_t count;
    uint32_t capacity;
    uint32_t grow_by;  // slots added each time the array is full

    // Below 0 when `key` sorts before `element`, 0 when equal, above 0 when after.
    int (*compare)(const void* key, const void* element);
    // Releases what an element owns beside its own block; may be null.
    void (*destroy)(void* element);

    probe_index index;  // none until list_use_index
};

// Null when there is no memory for the list. When there is none for the array, the list has a
// capacity of 0 and grows on first use.
[[nodiscard]] sorted_list* list_create(uint32_t capacity, uint32_t grow_by,
                                       int (*compare)(const void*, const void*),
                                       void (*destroy)(void*));

// From now on list_find goes through a hash index; for lists that compare_probes orders.
void list_use_index(sorted_list& list);

// The position of the element equal to `key`, or the one at which it would be inserted.
[[nodiscard]] uint32_t list_search(const sorted_list& list, const void* key, bool& found);

// The element equal to `key`, or null.
[[nodiscard]] void* list_find(const sorted_list& list, const void* key);

// Inserts `element` and gives 1. Gives 0 when it is null or a duplicate, which stays the caller's,
// or when the array cannot grow: the element is then destroyed and `element` null. Failures have
// been logged.
[[nodiscard]] int list_add(sorted_list& list, void*& element);

// Puts `element` behind the last one without looking at the order, as when a list is loaded.
// Gives 0 as list_add does when the array cannot grow.
[[nodiscard]] int list_append(sorted_list& list, void*& element);

// Calls `function` with each element in order, cast to `type*`.
template <class type>
void list_foreach(const sorted_list& list, auto function) {
    for (uint32_t i = 0; i < list.count; ++i) function(*static_cast<type*>(list.elements[i]));
}

// Destroys every element and the list, and nulls the pointer; null is fine.
void list_destroy(sorted_list*& list);

}  // namespace kivd
