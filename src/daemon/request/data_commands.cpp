// The commands that every client may send: probe data and queries.
#include "config/config_parts.h"
#include "config/filters.h"
#include "daemon/request/caller.h"
#include "daemon/request/commands.h"
#include "diag/diag_store.h"
#include "format/request_words.h"
#include "report/report_generation.h"
#include "runtime/log_and_raise.h"
#include "store/counters.h"
#include "store/events.h"
#include "store/static_data.h"
#include "util/numbers.h"
#include "util/unique_fd.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd";

void update_counter(request& r, counter_mode mode) {
    probe_id probe = {};
    if (!take_probe_id(r, probe)) return;
    const char* const value = next_token(r);
    if (!check_probe_value(r, probe, value)) return;
    counters_update(probe.package, probe.name, parse_saturated(value), mode, user_of(r));
}

}  // namespace

answer add_event(request& r) {
    probe_id probe = {};
    if (!take_probe_id(r, probe)) return no_answer();
    const std::span<const char> payload = raw_rest(r);
    if (payload.size() > max_payload_size) {
        log_and_raise(tag, "Too large event - dropping. [%s:%s] %zu bytes", probe.package,
                      probe.name, payload.size());
        return no_answer();
    }
    diag_add_event(probe.package, probe.name, payload);
    if (events_add(probe.package, probe.name, payload) == event_file::full) (void)generate_report();
    return no_answer();
}

answer set_counter(request& r) {
    update_counter(r, counter_mode::set);
    return no_answer();
}

answer increment_counter(request& r) {
    update_counter(r, counter_mode::increment);
    return no_answer();
}

answer set_static_data(request& r) {
    probe_id probe = {};
    if (!take_probe_id(r, probe)) return no_answer();
    const char* const value = text_rest(r);
    if (!check_probe_value(r, probe, value)) return no_answer();
    static_data_set(probe.package, probe.name, value, user_of(r));
    return no_answer();
}

answer is_alive(request& r) { return answer_with(r, "1"); }

answer is_probe_active(request& r) {
    probe_id probe = {};
    if (!take_probe_id(r, probe)) return no_answer();
    const bool wanted = filter_match(filter_kind::events, probe.package, probe.name) ||
                        diag_wants_probe(probe.package, probe.name);
    return answer_with(r, wanted ? "1" : "0");
}

answer get_config_part(request& r) {
    probe_id probe = {};
    if (!take_probe_id(r, probe)) return no_answer();
    return answer_with(r, get_config_fd(probe.package, probe.name));
}

}  // namespace kivd
