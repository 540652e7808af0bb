#include "daemon/request/data_commands.h"

#include "config/config_parts.h"
#include "config/filters.h"
#include "daemon/error/log_and_raise.h"
#include "diag/diag_store.h"
#include "report/report_generation.h"
#include "store/counter_store.h"
#include "store/event_store.h"
#include "store/static_store.h"
#include "util/numbers.h"
#include "util/unique_fd.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd";
constexpr size_t max_payload_size = 30720;

void update_counter(request& r, const char* command, counter_mode mode) {
    probe_id probe = {};
    if (!take_probe_id(r, command, probe)) return;
    const char* const value = next_token(r);
    if (!check_probe_value(command, probe, value)) return;
    counters_update(probe.package, probe.name, parse_saturated(value), mode);
}

}  // namespace

size_t add_event(request& r) {
    probe_id probe = {};
    if (!take_probe_id(r, "EV", probe)) return 0;
    const std::span<const char> payload = raw_rest(r);
    if (payload.size() > max_payload_size) {
        (void)log_and_raise(tag, "Too large event - dropping. [%s:%s] %zu bytes", probe.package,
                            probe.name, payload.size());
        return 0;
    }
    qz_add_event(probe.package, probe.name, payload);
    if (events_add(probe.package, probe.name, payload) == event_file::full) (void)generate_report();
    return 0;
}

size_t set_counter(request& r) {
    update_counter(r, "CS", counter_mode::set);
    return 0;
}

size_t increment_counter(request& r) {
    update_counter(r, "CI", counter_mode::increment);
    return 0;
}

size_t set_static_data(request& r) {
    probe_id probe = {};
    if (!take_probe_id(r, "SD", probe)) return 0;
    const char* const value = text_rest(r);
    if (check_probe_value("SD", probe, value)) sdata_set(probe.package, probe.name, value);
    return 0;
}

size_t is_alive(request& r) { return reply(r, "1"); }

size_t is_probe_active(request& r) {
    probe_id probe = {};
    if (!take_probe_id(r, "PA", probe)) return 0;
    const bool wanted = filter_match(filter_kind::events, probe.package, probe.name) ||
                        qz_wants_probe(probe.package, probe.name);
    return reply(r, wanted ? "1" : "0");
}

size_t get_config_part(request& r) {
    probe_id probe = {};
    if (!take_probe_id(r, "GC", probe)) return 0;
    return reply_with_descriptor(r, get_config_fd(probe.package, probe.name));
}

}  // namespace kivd
