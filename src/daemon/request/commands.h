// The handlers: a function for each row of format/requests.def, by the name it has there. Before
// one is called, the caller's permission has been checked, and whether data is being collected.
#pragma once

#include "daemon/request/request.h"

namespace kivd {

#define KIV_REQUEST(name, handler, ...) answer handler(request& r);
#include "format/requests.def"
#undef KIV_REQUEST

}  // namespace kivd
