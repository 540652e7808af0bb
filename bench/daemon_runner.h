// The daemon under measurement.
#pragma once

#include <atomic>
#include <string>
#include <thread>
#include <vector>

#include "bench/process.h"

namespace kivd::bench {

// What all measurements need to know.
struct setup {
    std::string kivd;     // the program
    std::string scratch;  // an empty directory for all that is written
    bool quick;
};

// How often a measurement is repeated, or how much of it there is.
[[nodiscard]] inline unsigned amount(const setup& s, unsigned full, unsigned quick) {
    return s.quick ? quick : full;
}

enum class compression : bool { off, on };

// Starts the daemon on `directory`, not detached, collecting, with the keys of a directory given
// with its final "/", or without any. It need not be up yet when this returns.
inline constexpr char no_keys[] = "NO_ENCRYPTION";
[[nodiscard]] daemon_process start_daemon(const setup& s, const std::string& directory,
                                          compression compress,
                                          const std::string& key_directory = no_keys);

// Increments each of the counters 0 to `count` - 1 once.
void touch_counters(const std::string& directory, unsigned count);

// Deletes the reports of a running daemon as they appear, in a thread of its own.
class report_remover {
 public:
    explicit report_remover(const std::string& directory);
    // Stops watching, deletes what is left; the bytes in all deleted reports together.
    size_t finish();

 private:
    void watch();
    void remove_all();

    std::string output_;
    unique_fd inotify_;
    std::atomic<bool> stop_ = false;
    size_t bytes_ = 0;
    std::jthread thread_;  // last: it uses the others
};

}  // namespace kivd::bench
