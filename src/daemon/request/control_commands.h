// The commands that control the daemon. Whether the caller may send them has been checked.
#pragma once

#include "daemon/request/request.h"

namespace kivd {

answer flush(request& r);                   // FL
answer force_save(request& r);              // FS
answer announce_configuration(request& r);  // NC
answer write_configuration(request& r);     // WC
answer read_device_id(request& r);          // GD
answer switch_data_collection(request& r);  // DC
answer remove_report(request& r);           // RM
answer next_file(request& r);               // FN
answer get_file(request& r);                // FG
answer accept_serial_number(request& r);    // SN
answer accept_imei(request& r);             // IM
answer add_group(request& r);               // SG
answer delete_group(request& r);            // DG
answer replace_group(request& r);           // RG

}  // namespace kivd
