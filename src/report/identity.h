// The device's identity: keeps the report header up to date with its sources, and sends out what
// was collected under the old identity when a known one changes.
#pragma once

#include <array>

namespace kivd {

// Rebuilds the header record and the report header. When that changes an identity whose product and
// device were known, a report is generated first; after any change the state file is saved. Ends
// the process when no report header can be had.
void update_header_info();

// Makes up a random device id when none is known yet, and saves the state file.
void ensure_device_id();

using device_id_buffer = std::array<char, 40>;
// The device id, padded with NULs; one of 40 characters has none.
void get_device_id(device_id_buffer& buffer);

// Group ids: the state file and the report header follow each change.
void set_group_id(const char* id);
void delete_group_id(const char* id);
void replace_group_id(const char* new_id, const char* old_id);

// Accepted for older clients, without effect: these two come from header_info.conf or the state
// file only.
inline void set_imei(const char* /*imei*/) {}
inline void set_serial_number(const char* /*number*/) {}

}  // namespace kivd
