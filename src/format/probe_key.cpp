#include "format/probe_key.h"

#include <cstring>

namespace kivd {

int compare_probes(const probe_key& a, const probe_key& b) {
    const int order = strcmp(a.package, b.package);
    return order != 0 ? order : strcmp(a.name, b.name);
}

}  // namespace kivd
