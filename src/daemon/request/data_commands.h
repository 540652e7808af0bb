// The commands that every client may send: probe data and queries. Each gives the length of the
// reply that it wrote over the packet, 0 for none.
#pragma once

#include <cstddef>

#include "daemon/request/request.h"

namespace kivd {

size_t add_event(request& r);          // EV
size_t set_counter(request& r);        // CS
size_t increment_counter(request& r);  // CI
size_t set_static_data(request& r);    // SD
size_t is_alive(request& r);           // IA
size_t is_probe_active(request& r);    // PA
size_t get_config_part(request& r);    // GC

}  // namespace kivd
