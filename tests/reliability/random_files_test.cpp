// The real daemon on private files with anything in them.
#include <algorithm>
#include <chrono>
#include <cstdio>
#include <random>

#include "end_to_end/daemon_test.h"
#include "settings.pb.h"
#include "support/config_package.h"

namespace kivd {
namespace {

using namespace std::string_literals;

constexpr int rounds = 100;

class random_files : directory_in_memory, public daemon_test {
 protected:
    // Has a daemon leave something of everything in private/, and adds what others put there and
    // what a kill may leave.
    void make_all_files() {
        std::filesystem::create_directory("input");
        write_file(
            "input/config",
            config_file({own_part<kiv::config::FilterConfig>(
                             "FilterConfig",
                             "event_filter { type: EXCLUDE item { package: 'a' name: 'b' } }"
                             "counter_filter { type: EXCLUDE } "
                             "staticdata_filter { type: EXCLUDE }"),
                         own_part<Settings>("Settings", "max_report_size: 100000"),
                         own_part<RunActions>("RunActions", "activate_lumora_diagnostics: true")}));
        daemon_process daemon = start();
        for (int i = 0; i < 20; ++i) {
            const std::string number = std::to_string(i);
            request({"CI p counter" + number + " 5", "SD p static" + number + " some text",
                     "EV p event some payload", "EV devicemonitor.powerstat ShutDown x"});
        }
        EXPECT_EQ(daemon.stop(), 0);
        const std::string events = read_file("private/events");
        write_file("private/header_info.conf", "id: P1\nrevision: 2\ndevice id: 3\ngroup id: 4\n");
        for (const char* name : {"flushed_data", "flushed_data.compacted", "counters.txt_",
                                 "kivd.state_tmp", "new_config.sig", "qz/qy_0", "qz_compressed"}) {
            write_file("private/"s + name, events.substr(0, 200));
        }
        std::filesystem::rename("private", "sound");
    }

    size_t below(size_t limit) { return limit > 0 ? random() % limit : 0; }

    void spoil(const std::string& path) {
        std::string bytes = read_file(path);
        switch (below(8)) {
            case 0:
                bytes.resize(below(5000));
                for (char& byte : bytes) byte = static_cast<char>(random());
                break;
            case 1:
                bytes.resize(below(bytes.size()));
                break;
            case 2:
                bytes = bytes.substr(below(bytes.size())) + bytes;
                break;
            case 3:
                std::filesystem::remove(path);
                switch (below(3)) {
                    case 0:
                        std::filesystem::create_directories(path + "/directory");
                        break;
                    case 1:
                        std::filesystem::create_symlink("nowhere", path);
                }
                return;
            default:
                for (size_t i = below(8); i > 0 && !bytes.empty(); --i) {
                    bytes[below(bytes.size())] = static_cast<char>(random());
                }
        }
        write_file(path, bytes);
    }

    std::minstd_rand random;  // the same each time
};

TEST_F(random_files, never_keep_it_from_serving) {
    using clock = std::chrono::steady_clock;
    make_all_files();
    clock::duration slowest = {};
    for (int round = 0; round < rounds; ++round) {
        SCOPED_TRACE(round);
        remove_everything_kept();
        std::filesystem::copy("sound", "private", std::filesystem::copy_options::recursive);
        std::vector<std::string> paths;
        for (const auto& entry : std::filesystem::recursive_directory_iterator("private")) {
            if (entry.is_regular_file()) paths.push_back(entry.path());
        }
        std::ranges::sort(paths);
        for (const std::string& path : paths) spoil(path);

        const auto begin = clock::now();
        daemon_process daemon = launch({{"-C"}});
        ASSERT_TRUE(daemon.wait_ready()) << daemon.log();
        slowest = std::max(slowest, clock::now() - begin);
        request({"CI p counter 1", "SD p static text", "EV p event x", "FS", "FL"});
        ASSERT_EQ(daemon.stop(), 0) << daemon.log();
    }
    printf("the slowest of %d starts took %.0f ms\n", rounds,
           std::chrono::duration<double, std::milli>(slowest).count());
}

}  // namespace
}  // namespace kivd
