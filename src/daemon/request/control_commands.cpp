#include "daemon/request/control_commands.h"

#include <cstring>

#include "daemon/error/log_and_raise.h"
#include "daemon/save_clock.h"
#include "report/identity.h"
#include "report/output_dir.h"
#include "report/report_generation.h"
#include "report/state_file.h"
#include "util/numbers.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd";

// Takes the next token; a missing one is logged with `complaint` and raised.
const char* take_argument(request& r, const char* complaint) {
    const char* const argument = next_token(r);
    if (argument == nullptr) (void)log_and_raise(tag, "%s", complaint);
    return argument;
}

}  // namespace

size_t flush(request& /*r*/) {
    (void)generate_report();
    update_header_info();
    return 0;
}

size_t force_save(request& /*r*/) {
    save_data();
    return 0;
}

size_t read_device_id(request& r) {
    device_id_buffer id;
    get_device_id(id);
    return reply(r, {id.data(), strnlen(id.data(), id.size())});
}

size_t switch_data_collection(request& r) {
    const char* const value = take_argument(r, "Enable/disable data collection without value.");
    if (value == nullptr) return 0;
    set_data_collection(parse_saturated(value) != 0);
    config_save();
    return 0;
}

size_t remove_report(request& r) {
    const char* const number = take_argument(r, "Remove report without number.");
    if (number != nullptr) delete_reports(parse_saturated(number));
    return 0;
}

size_t accept_serial_number(request& r) {
    const char* const number = take_argument(r, "set_serial_number without value.");
    if (number != nullptr) set_serial_number(number);
    return 0;
}

size_t accept_imei(request& r) {
    const char* const imei = take_argument(r, "set_imei without value.");
    if (imei != nullptr) set_imei(imei);
    return 0;
}

size_t add_group(request& r) {
    const char* const id = take_argument(r, "set_group_id without value.");
    if (id != nullptr) set_group_id(id);
    return 0;
}

size_t delete_group(request& r) {
    const char* const id = take_argument(r, "delete_group_id without value.");
    if (id != nullptr) delete_group_id(id);
    return 0;
}

size_t replace_group(request& r) {
    constexpr char complaint[] = "replace_group_id without valid value.";
    const char* const new_id = take_argument(r, complaint);
    if (new_id == nullptr) return 0;
    const char* const old_id = take_argument(r, complaint);
    if (old_id != nullptr) replace_group_id(new_id, old_id);
    return 0;
}

}  // namespace kivd
