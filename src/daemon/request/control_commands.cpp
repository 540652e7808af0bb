// The commands that control the daemon, and those that say who the device is.
#include <algorithm>
#include <cstdio>
#include <cstring>

#include "daemon/loop/save_clock.h"
#include "daemon/request/commands.h"
#include "diag/diag_store.h"
#include "diag/file_export.h"
#include "intake/intake.h"
#include "report/identity.h"
#include "report/output_dir.h"
#include "report/report_generation.h"
#include "report/state_file.h"
#include "runtime/log_and_raise.h"
#include "util/numbers.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd";

// Calls `act` with the next token; a missing one is logged with `complaint` and raised.
answer with_argument(request& r, const char* complaint, void (*act)(const char*)) {
    const char* const argument = next_token(r);
    if (argument != nullptr) {
        act(argument);
    } else {
        log_and_raise(tag, "%s", complaint);
    }
    return no_answer();
}

}  // namespace

answer flush(request& /*r*/) {
    (void)generate_report();
    update_header_info();
    return no_answer();
}

answer force_save(request& /*r*/) {
    save_data();
    return no_answer();
}

answer announce_configuration(request& r) {
    return answer_with(r, take_new_configuration() ? "1" : "0");
}

answer write_configuration(request& r) {
    constexpr size_t command_size = 3;  // with the delimiter behind it
    if (r.packet.size() < command_size) {
        log_and_raise(tag, "Badly formatted packet (%s) - dropping.", r.command);
        return no_answer();
    }
    replace_config_file(r.packet.subspan(command_size));
    return no_answer();
}

answer read_device_id(request& r) {
    device_id_buffer id;
    get_device_id(id);
    return answer_with(r, {id.data(), strnlen(id.data(), id.size())});
}

answer switch_data_collection(request& r) {
    return with_argument(r, "Enable/disable data collection without value.", [](const char* value) {
        const int32_t number = parse_saturated(value);
        set_data_collection(number != 0);
        diag_set_active(number);
        state_save();
    });
}

answer remove_report(request& r) {
    return with_argument(r, "Remove report without number.",
                         [](const char* number) { delete_reports(parse_saturated(number)); });
}

// With its NUL the reply is cut to one byte less than the request has.
answer next_file(request& r) {
    const char* const set = next_token(r);
    const char* const number = next_token(r);
    char digits[16];
    snprintf(digits, std::min(r.packet.size() - 1, sizeof digits), "%d",
             next_exported_file(set, number));
    return answer_with(r, digits);
}

answer get_file(request& r) {
    const char* const set = next_token(r);
    const char* const number = next_token(r);
    if (set == nullptr || number == nullptr) {
        log_and_raise(tag, "Badly formatted packet (%s) - dropping.", r.command);
        return answer_with(r, "FAIL");
    }
    return answer_with(r, open_exported_file(set, number));
}

answer accept_serial_number(request& r) {
    return with_argument(r, "set_serial_number without value.", set_serial_number);
}

answer accept_imei(request& r) { return with_argument(r, "set_imei without value.", set_imei); }

answer add_group(request& r) {
    return with_argument(r, "set_group_id without value.", set_group_id);
}

answer delete_group(request& r) {
    return with_argument(r, "delete_group_id without value.", delete_group_id);
}

answer replace_group(request& r) {
    const char* const new_id = next_token(r);
    const char* const old_id = next_token(r);
    if (new_id != nullptr && old_id != nullptr) {
        replace_group_id(new_id, old_id);
    } else {
        log_and_raise(tag, "replace_group_id without valid value.");
    }
    return no_answer();
}

}  // namespace kivd
