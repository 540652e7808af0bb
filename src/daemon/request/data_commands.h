// The commands that every client may send: probe data and queries.
#pragma once

#include "daemon/request/request.h"

namespace kivd {

answer add_event(request& r);          // EV
answer set_counter(request& r);        // CS
answer increment_counter(request& r);  // CI
answer set_static_data(request& r);    // SD
answer is_alive(request& r);           // IA
answer is_probe_active(request& r);    // PA
answer get_config_part(request& r);    // GC

}  // namespace kivd
