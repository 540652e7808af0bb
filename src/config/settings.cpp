#include "config/settings.h"

#include <fcntl.h>
#include <unistd.h>

#include "config/config_parts.h"
#include "platform/android_log.h"
#include "runtime/log_and_raise.h"
#include "runtime/stop.h"
#include "util/paths.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-settings";

// Now, and by the marker at every later start. Without the marker at least now.
void disable_permanently() {
    __android_log_print(ANDROID_LOG_INFO, tag, "Kill switch enabled");
    (void)unlink(paths::disable_marker);  // it could be a link or a pipe
    const unique_fd marker(
        open(paths::disable_marker, O_RDONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0755));
    request_stop();
}

// The sizes are no good unless they go together.
void check_limits(limits& values) {
    if (values.max_report_size <= values.max_output_dir_size) return;
    log_and_raise(tag,
                  "Bad settings found in configuration file, report_max_size (%zu) > "
                  "output_dir_max_size (%zu). Default values (%d)(%d) will be used",
                  size_t{values.max_report_size}, size_t{values.max_output_dir_size},
                  static_cast<int>(default_limits.max_report_size),
                  static_cast<int>(default_limits.max_output_dir_size));
    values.max_report_size = default_limits.max_report_size;
    values.max_output_dir_size = default_limits.max_output_dir_size;
}

}  // namespace

void apply_settings() {
    limits& values = get_limits();
    values = get_base_limits();
    const auto message = unpack_own_part<Kivd__Settings>(kivd__settings__descriptor, "Settings");
    if (!message) return;
    if (message->has_permanently_disable && message->permanently_disable) disable_permanently();
    for (const setting& each : settings) {
        if (*message.*each.is_given) values.*each.limit = *message.*each.given;
    }
    check_limits(values);
}

}  // namespace kivd
