#include "bench/daemon_runner.h"

#include <poll.h>
#include <sys/inotify.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <filesystem>

#include "bench/load.h"
#include "bench/measure.h"

namespace kivd::bench {

namespace {

constexpr int watch_interval_ms = 20;

}  // namespace

daemon_process start_daemon(const setup& s, const std::string& directory, compression compress,
                            const std::string& key_directory) {
    start_options options = {{"-D", "-C", "-c", key_directory, "-b", directory}};
    if (compress == compression::off) options.arguments.emplace_back("-Z");
    return {s.kivd, options};
}

void touch_counters(const std::string& directory, unsigned count) {
    const unique_fd producer = connect_producer(directory);
    for (unsigned i = 0; i < count; ++i) send_packet(producer.get(), increment_packet(i));
    wait_until_taken(producer.get());
}

report_remover::report_remover(const std::string& directory)
    : output_(directory + "/output"), inotify_(inotify_init1(IN_CLOEXEC | IN_NONBLOCK)) {
    if (inotify_add_watch(inotify_.get(), output_.c_str(), IN_MOVED_TO) == -1)
        give_up("inotify %s: %s", output_.c_str(), strerror(errno));
    thread_ = std::jthread([this] { watch(); });
}

size_t report_remover::finish() {
    stop_ = true;
    thread_.join();
    remove_all();
    return bytes_;
}

void report_remover::watch() {
    while (!stop_) {
        pollfd event{.fd = inotify_.get(), .events = POLLIN, .revents = 0};
        if (poll(&event, 1, watch_interval_ms) != 1) continue;
        alignas(inotify_event) char events[4096];
        if (read(inotify_.get(), events, sizeof events) <= 0) continue;
        remove_all();
    }
}

void report_remover::remove_all() {
    std::error_code error;
    for (const auto& entry : std::filesystem::directory_iterator(output_, error)) {
        if (!entry.path().filename().string().starts_with("kiv_")) continue;
        const auto size = entry.file_size(error);
        if (!error && std::filesystem::remove(entry.path(), error)) bytes_ += size;
    }
}

}  // namespace kivd::bench
