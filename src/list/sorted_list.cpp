#include "list/sorted_list.h"

#include <cstdlib>
#include <cstring>

#include "platform/android_log.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-list";

void destroy_element(const sorted_list& list, void*& element) {
    if (list.destroy != nullptr) list.destroy(element);
    free(element);
    element = nullptr;
}

bool make_room(sorted_list& list) {
    if (list.count < list.capacity) return true;
    const size_t capacity = size_t{list.count} + list.grow_by;
    void* const grown = realloc(list.elements, capacity * sizeof *list.elements);
    if (grown == nullptr) {
        __android_log_print(ANDROID_LOG_WARN, tag, "Failed to grow list to %zu elements", capacity);
        return false;
    }
    list.elements = static_cast<void**>(grown);
    list.capacity = static_cast<uint32_t>(capacity);
    return true;
}

}  // namespace

sorted_list* list_create(uint32_t capacity, uint32_t grow_by,
                         int (*compare)(const void*, const void*), void (*destroy)(void*)) {
    auto* const list = static_cast<sorted_list*>(malloc(sizeof(sorted_list)));
    if (list == nullptr) return nullptr;
    auto** const elements = static_cast<void**>(malloc(capacity * sizeof(void*)));
    *list = {elements, 0, elements != nullptr ? capacity : 0, grow_by, compare, destroy, {}};
    return list;
}

void list_use_index(sorted_list& list) {
    list.index = probe_index_create();
    for (uint32_t i = 0; i < list.count; ++i) probe_index_add(list.index, list.elements[i]);
}

uint32_t list_search(const sorted_list& list, const void* key, bool& found) {
    uint32_t low = 0;
    uint32_t high = list.count;
    found = false;
    while (low < high) {
        const uint32_t middle = low + (high - low) / 2;
        const int order = list.compare(key, list.elements[middle]);
        if (order == 0) {
            found = true;
            return middle;
        }
        if (order < 0) {
            high = middle;
        } else {
            low = middle + 1;
        }
    }
    return low;
}

void* list_find(const sorted_list& list, const void* key) {
    if (list.index.slots != nullptr) {
        return probe_index_find(list.index, *static_cast<const probe_key*>(key));
    }
    bool found = false;
    const uint32_t position = list_search(list, key, found);
    return found ? list.elements[position] : nullptr;
}

int list_add(sorted_list& list, void*& element) {
    if (element == nullptr) {
        __android_log_print(ANDROID_LOG_WARN, tag, "list_add: Element is NULL!");
        return 0;
    }
    if (!make_room(list)) {
        destroy_element(list, element);
        return 0;
    }
    bool found = false;
    const uint32_t position = list_search(list, element, found);
    if (found) {
        __android_log_print(ANDROID_LOG_WARN, tag, "list_add: Duplicate found!");
        return 0;
    }
    void** const slot = list.elements + position;
    memmove(slot + 1, slot, (list.count - position) * sizeof *slot);
    *slot = element;
    ++list.count;
    probe_index_add(list.index, element);
    return 1;
}

int list_append(sorted_list& list, void*& element) {
    if (!make_room(list)) {
        destroy_element(list, element);
        return 0;
    }
    list.elements[list.count++] = element;
    probe_index_add(list.index, element);
    return 1;
}

void list_destroy(sorted_list*& list) {
    if (list == nullptr) return;
    for (uint32_t i = 0; i < list->count; ++i) destroy_element(*list, list->elements[i]);
    probe_index_release(list->index);
    free(list->elements);
    free(list);
    list = nullptr;
}

}  // namespace kivd
