// The commands that control the daemon. Each gives the length of the reply that it wrote over the
// packet, 0 for none. Whether the caller may send them has been checked.
#pragma once

#include <cstddef>

#include "daemon/request/request.h"

namespace kivd {

size_t flush(request& r);                   // FL
size_t force_save(request& r);              // FS
size_t announce_configuration(request& r);  // NC
size_t write_configuration(request& r);     // WC
size_t read_device_id(request& r);          // GD
size_t switch_data_collection(request& r);  // DC
size_t remove_report(request& r);           // RM
size_t next_file(request& r);               // FN
size_t get_file(request& r);                // FG
size_t accept_serial_number(request& r);    // SN
size_t accept_imei(request& r);             // IM
size_t add_group(request& r);               // SG
size_t delete_group(request& r);            // DG
size_t replace_group(request& r);           // RG

}  // namespace kivd
