// How the items of a probe filter are matched, and which of them go together.
#pragma once

#include <cstddef>
#include <span>

#include "format/probe_key.h"

namespace kivd {

// Compares like compare_probes, but a package that starts with "*" is equal to every other, and a
// name that does to every name of its package.
[[nodiscard]] int compare_filtered(const probe_key& a, const probe_key& b);

// Items that are equal to each other clash: a filter can't hold both. Copies as many of the first
// `items` as go together to `sorted`, which has as many places, in the order of compare_probes.
// Gives their number: the item behind them, if there is one, clashes with one of them. There may be
// a great many, so they are sorted rather than inserted one by one: items that clash are
// neighbours.
[[nodiscard]] size_t sort_compatible(std::span<const probe_key> items, std::span<probe_key> sorted);

}  // namespace kivd
