#include "diag/diag_store.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstring>
#include <iterator>
#include <string_view>

#include "diag/diag_files.h"
#include "diag/log_message.h"
#include "platform/android_log.h"
#include "record/event_record.h"
#include "record/gzip_file.h"
#include "record/record_file.h"
#include "runtime/child_process.h"
#include "runtime/log_and_raise.h"
#include "util/paths.h"
#include "util/unique_fd.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-qz";
constexpr off_t max_file_size = 204800;  // bytes; the event that goes beyond is still kept
constexpr int32_t full_files = 3;        // that stay beside the one being written

struct selection {
    std::string_view package_end;
    std::string_view name;
    bool (*check)(std::span<const char> payload);  // null: every payload will do
};
constexpr selection selections[] = {
    {"devicemonitor.powerstat", "ShutDown", nullptr},
    {"devicemonitor.powerstat", "BootComplete", nullptr},
    {"kiv.system_logging", "LogMessage", is_kept_log_message},
};

constinit int32_t active = 0;
constinit pid_t compressor_pid = -1;

// Null when the store does not want such events.
const selection* find_selection(std::string_view package, std::string_view name) {
    const auto* const found = std::ranges::find_if(selections, [package, name](const auto& each) {
        return package.ends_with(each.package_end) && name == each.name;
    });
    return found != std::end(selections) ? found : nullptr;
}

bool is_selected(const char* package, const char* name, std::span<const char> payload) {
    const selection* const found = find_selection(package, name);
    if (found == nullptr) return false;
    return found->check == nullptr || payload.empty() || found->check(payload);
}

unique_fd open_current(int32_t number) {
    const diag_path path('z', number);
    unique_fd fd(open(path.text, O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC | O_NONBLOCK, 0700));
    if (!fd.ok()) {
        log_and_raise(tag, "Failed to open %s, <%s>", path.text, strerror(errno));
    }
    return fd;
}

// The compressed file takes the plain one's place when it is complete, so that no cut one hides it.
void compress(int32_t number) {
    const diag_path plain('z', number);
    const diag_path compressed('y', number);
    if (gzip_file(plain.text, paths::diag_compressed, gzip_level::best)) {
        if (rename(paths::diag_compressed, compressed.text) == 0) return delete_diag_file(plain);
        log_and_raise(tag, "Failed to rename %s to %s, <%s>", paths::diag_compressed,
                      compressed.text, strerror(errno));
    }
    (void)unlink(paths::diag_compressed);
}

void start_compressor(int32_t number) {
    if (compressor_pid >= 0) {
        __android_log_print(ANDROID_LOG_INFO, tag, "Compressing Report. Waiting...");
    }
    diag_wait_for_compressor();
    __android_log_print(ANDROID_LOG_INFO, tag, "Compressing Report...");
    compressor_pid = fork_child(child_kind::worker);
    if (compressor_pid < 0) log_and_raise(tag, "Failed to fork compactor thread.");
    if (compressor_pid != 0) return;

    compress(number);
    __android_log_print(ANDROID_LOG_INFO, tag, "Compressing Report. Done...");
    _exit(0);
}

// Deletes the files that are too old by now; returns the number of the next one.
int32_t make_room(const diag_numbers& numbers) {
    if (numbers.highest == INT32_MAX) {
        diag_wait_for_compressor();  // or its file would come back
        delete_diag_files(INT32_MIN, INT32_MAX);
        return 1;
    }
    if (numbers.highest > full_files) {
        delete_diag_files(numbers.lowest, numbers.highest - full_files);
    }
    return numbers.highest + 1;
}

// The file that takes the next event.
unique_fd open_write_file() {
    diag_numbers numbers;
    if (!scan_diag_files(numbers)) {
        log_and_raise(tag, "qz_file_statdir() failed: %s", strerror(errno));
        return unique_fd();
    }
    unique_fd current = open_current(numbers.highest);
    if (!current.ok() || lseek(current.get(), 0, SEEK_END) < max_file_size) return current;

    __android_log_print(ANDROID_LOG_INFO, tag, "Max file size reached, opening new file");
    const int32_t next = make_room(numbers);
    current = open_current(next);
    // The next file has to exist first: if we compressed before, a crash would reuse the number,
    // and the new file would replace the compressed one.
    if (current.ok() && next > numbers.highest) start_compressor(numbers.highest);
    return current;
}

void switch_off() {
    diag_wait_for_compressor();  // it would leave another file
    delete_all_diag_entries();
    (void)unlink(paths::diag_compressed);  // of a compressor that was killed
    if (rmdir(paths::diag_dir) == 0 || errno == ENOENT) return;
    log_and_raise(tag, "Failed to remove Lumora Diagnostics output directory: %s", strerror(errno));
}

// Nothing may be appended behind a record that a crash has torn.
void qz_rescue_event_file() {
    diag_numbers numbers;
    if (!scan_diag_files(numbers)) {
        log_and_raise(tag, "qz_rescue_event_file: qz_file_statdir() failed: %s", strerror(errno));
        return;
    }
    rescue_event_file(diag_path('z', numbers.highest).text, record_header::absent);
}

void switch_on() {
    if (mkdir(paths::diag_dir, 0700) != 0 && errno != EEXIST) {
        log_and_raise(tag, "Failed to create Lumora Diagnostics output directory: %s",
                      strerror(errno));
    }
    qz_rescue_event_file();
}

}  // namespace

void diag_set_active(int32_t value) {
    active = value;
    value != 0 ? switch_on() : switch_off();
}

void diag_add_event(const char* package, const char* name, std::span<const char> payload) {
    if (active == 0 || !is_selected(package, name, payload)) return;
    const unique_fd file = open_write_file();
    const off_t size = file.ok() ? lseek(file.get(), 0, SEEK_END) : -1;
    event_record record;
    if (size < 0 || !make_event_record(record, package, name, payload, tag)) return;
    (void)write_event_records(file.get(), static_cast<uint64_t>(size), {&record, 1}, tag);
}

bool diag_wants_probe(const char* package, const char* name) {
    return active == 1 && find_selection(package, name) != nullptr;
}

uint32_t diag_space_reserve() { return active != 0 ? diag_reserved_space : 0; }

void diag_wait_for_compressor() { wait_for_child(compressor_pid); }

void diag_release() {
    diag_wait_for_compressor();
    active = 0;
    diag_files_release();
}

}  // namespace kivd
