// What carries out the requests: a function for each row of format/requests.def, named there. By
// then the caller's permission has been checked, and whether data is collected at all.
#pragma once

#include "daemon/request/request.h"

namespace kivd {

#define KIV_REQUEST(name, handler, ...) answer handler(request& r);
#include "format/requests.def"
#undef KIV_REQUEST

}  // namespace kivd
