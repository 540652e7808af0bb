#include "daemon/modules.h"

#include "config/config_parts.h"
#include "config/filters.h"
#include "config/limits.h"
#include "daemon/loop/save_clock.h"
#include "daemon/net/delays.h"
#include "diag/diag_store.h"
#include "intake/log_reader.h"
#include "platform/permission.h"
#include "record/header_record.h"
#include "record/record_file.h"
#include "report/identity.h"
#include "report/output_dir.h"
#include "report/report_generation.h"
#include "report/state_file.h"
#include "runtime/daemon_error.h"
#include "runtime/stop.h"
#include "security/key_paths.h"
#include "store/counters.h"
#include "store/events.h"
#include "store/static_data.h"
#include "util/clock.h"
#include "util/paths.h"

namespace kivd {

bool start_modules() {
    daemon_error_init(paths::working_dir);
    rescue_event_file(paths::events, record_header::expected);
    counters_init();
    static_data_init();
    state_load();
    (void)prune_dir();
    ensure_device_id();
    update_header_info();
    load_config_list();
    return load_filters();
}

void release_modules() {
    save_clock_release();
    delays_release();
    log_reader_release();
    report_generation_release();
    diag_release();
    counters_release();
    static_data_release();
    events_release();
    state_release();
    release_header();
    release_filters();
    release_config_list();
    limits_release();
    clear_report_key_path();
    clear_config_key_path();
    forget_permissions();
    stop_release();
    daemon_error_release();
    leave_test_mode();
}

}  // namespace kivd
