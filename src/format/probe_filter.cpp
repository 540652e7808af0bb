#include "format/probe_filter.h"

#include <algorithm>
#include <cstring>

namespace kivd {
namespace {

// Sorts a copy of all items. False when two of them clash: then two neighbours do.
bool sort_all(std::span<const probe_key> items, std::span<probe_key> sorted) {
    const auto copied = sorted.first(items.size());
    std::ranges::copy(items, copied.begin());
    std::ranges::sort(
        copied, [](const probe_key& a, const probe_key& b) { return compare_probes(a, b) < 0; });
    const auto clash = [](const probe_key& a, const probe_key& b) {
        return compare_filtered(a, b) == 0;
    };
    return std::ranges::adjacent_find(copied, clash) == copied.end();
}

}  // namespace

int compare_filtered(const probe_key& a, const probe_key& b) {
    if (*a.package == '*' || *b.package == '*') return 0;
    if (const int order = strcmp(a.package, b.package); order != 0) return order;
    if (*a.name == '*' || *b.name == '*') return 0;
    return strcmp(a.name, b.name);
}

size_t sort_compatible(std::span<const probe_key> items, std::span<probe_key> sorted) {
    if (sort_all(items, sorted)) return items.size();
    size_t compatible = 1;
    size_t too_many = items.size();
    while (too_many - compatible > 1) {
        const size_t middle = compatible + (too_many - compatible) / 2;
        (sort_all(items.first(middle), sorted) ? compatible : too_many) = middle;
    }
    (void)sort_all(items.first(compatible), sorted);
    return compatible;
}

}  // namespace kivd
