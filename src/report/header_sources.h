// Where the values of the report header come from: system properties, private/header_info.conf and
// local time.
#pragma once

#include <cstdint>

#include "record/header_record.h"

namespace kivd {

// Whether the identity is given by hand: in test mode, or when private/header_info.conf exists.
[[nodiscard]] bool has_header_info();

// How many seconds local time is east of UTC now; -1 in test mode.
[[nodiscard]] int32_t local_utc_offset();

// Fills a header with initial values from the sources, group ids of header_info.conf included.
// What no source gives stays "unknown".
void gather_header(header_record& candidate);

// Adds the group id property to a header that already has its other ids, unless the identity is
// given by hand.
void add_group_id_property(header_record& candidate);

// The fixed identity of test mode. Group ids stay.
void set_test_identity(header_record& header);

}  // namespace kivd
