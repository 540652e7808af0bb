// The pair of texts that names a probe. The entries of every list begin with one.
#pragma once

namespace kivd {

struct probe_key {
    const char* package;
    const char* name;
};

// Compares packages, then names, byte by byte. Below 0 when `a` sorts before `b`, 0 when they are
// equal, above 0 when after.
[[nodiscard]] int compare_probes(const probe_key& a, const probe_key& b);

}  // namespace kivd
