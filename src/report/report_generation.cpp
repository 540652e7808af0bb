#include "report/report_generation.h"

#include <fcntl.h>
#include <sys/types.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <optional>

#include "platform/android_log.h"
#include "record/gzip_file.h"
#include "record/record_file.h"
#include "report/header_sources.h"
#include "report/output_dir.h"
#include "report/report_sealing.h"
#include "report/state_file.h"
#include "runtime/child_process.h"
#include "runtime/log_and_raise.h"
#include "security/crypto_module.h"
#include "security/key_paths.h"
#include "store/counters.h"
#include "store/events.h"
#include "store/static_data.h"
#include "util/clock.h"
#include "util/file_io.h"
#include "util/file_replacement.h"
#include "util/paths.h"
#include "util/unique_fd.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-compactor";

constinit pid_t compactor_pid = -1;
constinit gzip_level compression = gzip_level::best;

// Moves what has been collected into the file that the compactor takes.
bool flush_stores() {
    if (!events_flush()) return log_and_raise(tag, "Failed to flush events");

    const unique_fd fd(open(paths::flushed_data, O_WRONLY | O_APPEND | O_CLOEXEC));
    const off_t size = fd.ok() ? lseek(fd.get(), 0, SEEK_END) : -1;
    if (size < 0) {
        return log_and_raise(tag, "Failed to open flushed data for writing: %s", strerror(errno));
    }
    record_appender report(fd.get(), static_cast<uint64_t>(size));
    const int64_t flush_time = now_ms();
    counters_write_report(report, get_last_flush());
    static_data_write_report(report, get_last_flush());
    set_last_flush(flush_time);
    return true;
}

void start_compactor() {
    if (is_sealing_on()) (void)get_crypto();  // or each compactor would load it
    const pid_t pid = fork_child(child_kind::worker);
    if (pid < 0) {
        log_and_raise(tag, "Failed to fork compactor thread.");
        return;
    }
    if (pid > 0) {
        compactor_pid = pid;
        return;
    }
    if (!compact_report()) _exit(1);
    __android_log_print(ANDROID_LOG_INFO, tag, "Compactor all done.");
    _exit(0);
}

// Moves a finished report to where collectors find it, which may be another file system.
bool publish_report(const char* path) {
    if (rename(paths::compacted_data, path) == 0) return true;
    if (errno != EXDEV) return false;
    const unique_fd source = open_readable(paths::compacted_data);
    file_replacement copy(path, paths::new_report);
    if (!source.ok() || !copy.ok() || !copy_all(source.get(), copy.fd()) || !copy.close() ||
        !copy.put_into_place()) {
        return false;
    }
    (void)unlink(paths::compacted_data);
    return true;
}

}  // namespace

bool generate_report() {
    if (!has_data_to_report()) return false;
    __android_log_print(ANDROID_LOG_INFO, tag, "Generating Report...");
    wait_for_compactor();
    if (!flush_stores()) return false;
    start_compactor();
    return true;
}

bool has_data_to_report() {
    return has_header_info() || counters_pending(get_last_flush()) ||
           static_data_pending(get_last_flush()) || events_pending();
}

bool compact_report() {
    const std::optional<int32_t> highest = prune_dir();
    if (!highest) return log_and_raise(tag, "Corrupt output directory - will not do anything.");
    if (!gzip_file(paths::flushed_data, paths::compacted_data, compression)) {
        return log_and_raise(tag, "Failed to compact file");
    }
    if (is_sealing_on() && !seal_compacted_data()) return false;
    const report_path report(next_report_number(*highest));
    if (!publish_report(report.text)) {
        return log_and_raise(tag, "Failed to rename output file: %s", strerror(errno));
    }
    (void)unlink(paths::flushed_data);
    return true;
}

void wait_for_compactor() { wait_for_child(compactor_pid); }

void set_output_compression(bool enabled) {
    compression = enabled ? gzip_level::best : gzip_level::stored;
}

void report_generation_release() {
    wait_for_compactor();
    set_output_compression(true);
}

}  // namespace kivd
