#include "intake/run_actions.h"

#include "config/config_parts.h"
#include "diag/diag_store.h"
#include "intake/log_reader.h"
#include "report/output_dir.h"
#include "report/report_generation.h"
#include "settings.pb-c.h"

namespace kivd {
namespace {

constexpr char once_part[] = "RunActionsOnce";

}  // namespace

void run_actions() {
    const auto actions =
        unpack_own_part<Kivd__RunActions>(kivd__run_actions__descriptor, "RunActions");
    if (!actions) return;
    stop_log_reader();
    if (actions->has_run_log_reader && actions->run_log_reader) start_log_reader();
    diag_set_active(actions->has_activate_lumora_diagnostics &&
                    actions->activate_lumora_diagnostics);
}

void run_actions_once() {
    const auto actions =
        unpack_own_part<Kivd__RunActionsOnce>(kivd__run_actions_once__descriptor, once_part);
    if (!actions) return;
    if (actions->has_remove_reports && actions->remove_reports) {
        wait_for_compactor();  // its report is one of them
        delete_reports(0);
    }
    retire_own_part(once_part);
}

}  // namespace kivd
