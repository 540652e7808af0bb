#include "config/settings.h"

#include <fcntl.h>

#include "config/config_parts.h"
#include "config/limits.h"
#include "platform/android_log.h"
#include "runtime/log_and_raise.h"
#include "runtime/stop.h"
#include "settings.pb-c.h"
#include "util/paths.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-settings";

void return_to_defaults(limits& values) {
    values.max_report_size = default_max_report_size;
    values.max_output_dir_size = default_max_output_dir_size;
    values.expire_counters_age = values.base_expire_counters_age;
    values.expire_sdata_age = values.base_expire_sdata_age;
}

// Now, and by the marker at every later start. Without the marker at least now.
void disable_permanently() {
    __android_log_print(ANDROID_LOG_INFO, tag, "Kill switch enabled");
    const unique_fd marker(
        open(paths::disable_marker, O_RDONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0755));
    request_stop();
}

void take_limits(const Kivd__Settings& settings, limits& values) {
    const auto take = [](uint32_t& value, bool present, uint32_t given) {
        if (present) value = given;
    };
    take(values.max_output_dir_size, settings.has_max_output_dir_size,
         settings.max_output_dir_size);
    take(values.max_report_size, settings.has_max_report_size, settings.max_report_size);
    take(values.expire_counters_age, settings.has_expire_counters_age,
         settings.expire_counters_age);
    take(values.expire_sdata_age, settings.has_expire_sdata_age, settings.expire_sdata_age);
}

void check_limits(limits& values) {
    if (values.max_report_size <= values.max_output_dir_size) return;
    log_and_raise(tag,
                  "Bad settings found in configuration file, report_max_size (%zu) > "
                  "output_dir_max_size (%zu). Default values (%d)(%d) will be used",
                  size_t{values.max_report_size}, size_t{values.max_output_dir_size},
                  static_cast<int>(default_max_report_size),
                  static_cast<int>(default_max_output_dir_size));
    values.max_report_size = default_max_report_size;
    values.max_output_dir_size = default_max_output_dir_size;
}

}  // namespace

void apply_settings() {
    limits& values = get_limits();
    return_to_defaults(values);
    const auto settings =
        unpack_own_part<kivd__settings__unpack, kivd__settings__free_unpacked>("Settings");
    if (!settings) return;
    if (settings->has_permanently_disable && settings->permanently_disable) disable_permanently();
    take_limits(*settings, values);
    check_limits(values);
}

}  // namespace kivd
