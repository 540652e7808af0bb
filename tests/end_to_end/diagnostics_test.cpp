// The diagnostics store from outside: switched on and off, fed, walked and fetched.
#include <fcntl.h>

#include "client/kiv.h"
#include "daemon_test.h"
#include "settings.pb.h"
#include "support/config_package.h"
#include "system_logging.pb.h"

namespace kivd {
namespace {

using enum socket_kind;

class diagnostics : public daemon_test {};

std::string crash(size_t size) {
    kiv::system_logging::LogMessage message;
    message.set_log(kiv::system_logging::MAIN);
    message.set_tag("am_crash");
    message.set_msg(std::string(size, 'x'));
    return "EV kiv.system_logging LogMessage " + message.SerializeAsString();
}

// The files that a client finds, in their order, decompressed.
std::vector<std::string> fetch_files(const std::string& directory) {
    std::vector<std::string> files;
    kiv_handle* const kiv = kiv_create_from_path(directory.c_str());
    for (int32_t number = 0; (number = kiv_next_file(kiv, number)) >= 0;) {
        const unique_fd fd(kiv_get_file(kiv, number));
        EXPECT_EQ(fcntl(fd.get(), F_GETFL) & O_ACCMODE, O_RDONLY);
        const std::string path = "/proc/self/fd/" + std::to_string(fd.get());
        const std::string bytes = read_file(path);
        files.push_back(bytes.starts_with("\x1f\x8b") ? gunzip_file(path) : bytes);
    }
    kiv_destroy(kiv);
    return files;
}

TEST_F(diagnostics, are_kept_over_restarts_and_fetched_until_they_are_switched_off) {
    daemon_process daemon = start();
    request({crash(10)});  // not yet on
    const auto on = own_part<RunActions>("RunActions", "activate_lumora_diagnostics: true");
    const auto filter =
        own_part<kiv::config::FilterConfig>("FilterConfig", "event_filter { type: INCLUDE }");
    write_file("input/config", config_file({on, filter}));
    const unique_fd client = connect_client(packets);
    EXPECT_EQ(ask(client.get(), "NC"), "1");
    EXPECT_EQ(ask(client.get(), "PA kiv.system_logging LogMessage"), "1");
    EXPECT_EQ(ask(client.get(), "PA kiv.system_logging Other"), "0");

    const size_t events = parse(read_file("private/events")).events_size();
    request({crash(20), crash(30), "EV p other x"});
    EXPECT_EQ(parse(read_file("private/events")).events_size(), events);  // the filter's business
    request(std::vector(25, crash(30000)));  // three files full, and one begun
    daemon.send_signal(SIGKILL);
    (void)daemon.wait_exit();
    daemon = start();
    request({crash(40)});

    std::vector<std::string> files;
    ASSERT_TRUE(wait_until([&] {  // the last compressor is done
        files = fetch_files(directory);
        return !exists("private/qz_compressed") && files.size() == 4;
    }));
    size_t found = 0;
    for (const std::string& file : files) {
        kiv::Report records;
        ASSERT_TRUE(records.ParsePartialFromString(file));
        found += static_cast<size_t>(records.events_size());
    }
    EXPECT_EQ(found, 28U);

    request({"DC 0"});
    EXPECT_FALSE(exists("private/qz"));
    request({"DC 2", crash(50)});
    EXPECT_EQ(ask(connect_client(packets).get(), "PA kiv.system_logging LogMessage"), "0");
    EXPECT_EQ(fetch_files(directory).size(), 1U);
    write_file("input/config", config_file({own_part<RunActions>("RunActions", "")}));
    EXPECT_EQ(ask(connect_client(packets).get(), "NC"), "1");
    EXPECT_FALSE(exists("private/qz"));
    EXPECT_EQ(daemon.stop(), 0);
}

}  // namespace
}  // namespace kivd
