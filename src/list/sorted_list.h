// A growable array of entries (list/entry.h), which it owns, in ascending order. Entries are never
// removed one by one: an owner that needs another set builds a new list.
#pragma once

#include <algorithm>
#include <cstdint>
#include <span>

#include "format/probe_key.h"
#include "list/entry.h"
#include "list/probe_index.h"

namespace kivd {

// Below 0 when `a` sorts before `b`, 0 when they are equal, above 0 when after.
using probe_order = int (*)(const probe_key& a, const probe_key& b);

// What lists of all types have in common.
class any_list {
 public:
    [[nodiscard]] uint32_t size() const { return count_; }

    // From now on entries are found through a hash index; for lists that compare_probes orders.
    void use_index();

 protected:
    // `grow_by`: slots added each time the array is full.
    constexpr any_list(uint32_t grow_by, probe_order order) : grow_by_(grow_by), order_(order) {}
    any_list(any_list&& other) noexcept : grow_by_(0), order_(nullptr) { swap(other); }
    ~any_list() { free(keys_); }
    void swap(any_list& other) noexcept;

    [[nodiscard]] probe_key* find_key(const probe_key& key) const;
    [[nodiscard]] bool add_key(probe_key* added);     // false: a duplicate, or no room; logged
    [[nodiscard]] bool append_key(probe_key* added);  // false: no room; logged
    void keep_first(uint32_t count);
    void forget_keys();

    [[nodiscard]] std::span<probe_key*> keys() const { return {keys_, count_}; }

 private:
    [[nodiscard]] uint32_t search(const probe_key& key, bool& found) const;
    [[nodiscard]] bool make_room();

    probe_key** keys_ = nullptr;  // each the beginning of an entry
    uint32_t count_ = 0;
    uint32_t capacity_ = 0;
    uint32_t grow_by_;
    probe_order order_;
    probe_index index_;  // none until use_index
};

template <class entry>
class sorted_list : public any_list {
 public:
    constexpr explicit sorted_list(uint32_t grow_by, probe_order order = compare_probes)
        : any_list(grow_by, order) {}
    sorted_list(sorted_list&& other) noexcept = default;
    sorted_list& operator=(sorted_list&& other) noexcept {
        swap(other);
        return *this;
    }
    ~sorted_list() { clear(); }

    // The entry equal to `key`, or null.
    [[nodiscard]] entry* find(const probe_key& key) const {
        return static_cast<entry*>(find_key(key));
    }

    // Inserts an entry. Gives it, or null, with the entry gone, when there is one equal to it or
    // the array cannot grow; either has been logged.
    entry* add(unique_entry<entry> added) {
        return add_key(added.get()) ? added.release() : nullptr;
    }

    // Puts an entry behind the last one without looking at the order, as when a list is loaded.
    // False, with the entry gone, when the array cannot grow, which has been logged.
    [[nodiscard]] bool append(unique_entry<entry> added) {
        if (!append_key(added.get())) return false;
        (void)added.release();
        return true;
    }

    // Calls `function` with each entry in order.
    void for_each(auto function) const {
        (void)any_of([&](entry& each) {
            function(each);
            return false;
        });
    }
    // Whether `condition` holds for one of them; it sees them in order up to that one.
    [[nodiscard]] bool any_of(auto condition) const {
        const std::span<probe_key*> all = keys();
        for (size_t i = 0; i < all.size(); ++i) {
            if (all.size() - i > fetched_ahead) fetch(all[i + fetched_ahead]);
            if (condition(static_cast<entry&>(*all[i]))) return true;
        }
        return false;
    }

    // For lists that were not saved in order. `less` tells which of two entries comes first.
    void sort(auto less) {
        std::ranges::sort(keys(), [less](const probe_key* a, const probe_key* b) {
            return less(static_cast<const entry&>(*a), static_cast<const entry&>(*b));
        });
    }
    // Releases each entry for which `condition(entry, the next one or null)` holds.
    void drop_if(auto condition) {
        const std::span<probe_key*> all = keys();
        uint32_t kept = 0;
        for (size_t i = 0; i < all.size(); ++i) {
            auto* const each = static_cast<entry*>(all[i]);
            const auto* const next =
                i + 1 < all.size() ? static_cast<const entry*>(all[i + 1]) : nullptr;
            if (condition(*each, next)) {
                unique_entry<entry>(each).reset();
            } else {
                all[kept++] = each;
            }
        }
        keep_first(kept);
    }

    // Releases every entry, and the index.
    void clear() {
        for (probe_key* const key : keys()) unique_entry<entry>(static_cast<entry*>(key)).reset();
        forget_keys();
    }

 private:
    // Entries lie anywhere in memory: waiting for each of them would be most of a walk.
    static constexpr size_t fetched_ahead = 8;
    static void fetch(const probe_key* key) {
        const auto* const lines = reinterpret_cast<const char*>(key);
        __builtin_prefetch(lines);
        __builtin_prefetch(lines + 64);
    }
};

}  // namespace kivd
