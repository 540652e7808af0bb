// What the tests of the whole daemon share: a directory, the daemon in it, and what it leaves
// there.
#pragma once

#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <map>
#include <stdexcept>
#include <string>
#include <vector>

#include "bench/daemon_process.h"
#include "report.pb.h"
#include "support/scratch_directory.h"

namespace kivd {

// The test runs in the daemon's directory.
class daemon_test : public testing::Test {
 protected:
    daemon_test() {
        directory = testing::TempDir() + "kivd-XXXXXX";
        EXPECT_NE(mkdtemp(directory.data()), nullptr);
        EXPECT_EQ(chdir(directory.c_str()), 0);
        // for the clients and daemons that run as somebody else
        std::filesystem::permissions(".", std::filesystem::perms(0755));
    }
    ~daemon_test() override {
        EXPECT_EQ(chdir("/"), 0);
        std::error_code mounted;
        std::filesystem::remove_all(directory, mounted);
    }

    // Not detached, without encryption.
    [[nodiscard]] daemon_process launch(start_options options) const {
        const std::vector<std::string> usual = {"-D", "-b", directory, "-c", "NO_ENCRYPTION"};
        options.arguments.insert(options.arguments.begin(), usual.begin(), usual.end());
        return {KIVD_PATH, options};
    }
    // Waits until it serves; as long as an ended daemon's compactor holds the lock, tries again.
    [[nodiscard]] daemon_process start(const start_options& options = {{"-C"}}) const {
        daemon_process started;
        EXPECT_TRUE(wait_until([&] {
            started = launch(options);
            return started.wait_ready() || started.count_in_log("already running") == 0;
        }));
        if (!started.wait_ready()) throw std::runtime_error("no start: " + started.log());
        return started;
    }

    std::string directory;
};

// Sends the requests on one connection and returns when the daemon is through with them.
inline void request(const std::vector<std::string>& requests) {
    const unique_fd client = connect_client(socket_kind::packets);
    for (const std::string& each : requests) EXPECT_TRUE(send_text(client.get(), each)) << each;
    EXPECT_EQ(ask(client.get(), "IA"), "1");
}

// How many errors were logged, but for the one that is of the machine: nothing is installed on it.
inline size_t errors(const daemon_process& daemon) {
    return daemon.count_in_log(" E ") -
           daemon.count_in_log(" E kivd-conf: Failed to open /system/etc/kivd.conf.");
}

inline kiv::Report parse(const std::string& bytes) {
    kiv::Report report;
    EXPECT_TRUE(report.ParseFromString(bytes)) << bytes.size() << " bytes";
    return report;
}

// The reports in the output directory, by number.
inline std::map<int, std::string> report_paths() {
    std::map<int, std::string> found;
    for (const auto& entry : std::filesystem::directory_iterator("output")) {
        const std::string name = entry.path().filename();
        if (name.starts_with("kiv_")) found[std::stoi(name.substr(4))] = entry.path();
    }
    return found;
}

// All that has been collected so far, in its order.
inline kiv::Report everything_kept() {
    std::string all;
    for (const auto& [number, path] : report_paths()) all += gunzip_file(path);
    return parse(all + read_file("private/flushed_data") + read_file("private/events"));
}

inline void remove_everything_kept() {
    for (const char* name : {"output", "private"}) std::filesystem::remove_all(name);
}

// The finished report with that number, once it is there.
inline kiv::Report wait_report(int number) {
    const std::string path = "output/kiv_" + std::to_string(number);
    EXPECT_TRUE(wait_until([&] { return exists(path); })) << path;
    return parse(gunzip_file(path));
}

}  // namespace kivd
