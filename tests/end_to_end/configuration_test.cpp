// A configuration's whole life, and what it makes of the reports. Keys, signatures and seals are
// openssl's on the other side.
#include <fcntl.h>
#include <sched.h>
#include <sys/mount.h>

#include "daemon_test.h"
#include "settings.pb.h"
#include "support/config_package.h"

namespace kivd {
namespace {

using namespace std::string_literals;
using enum socket_kind;

class configuration : public daemon_test {};

// What NC answers.
std::string install(const std::string& file) {
    const unique_fd client = connect_client(packets);
    EXPECT_TRUE(send_text(client.get(), "WC " + file));
    return ask(client.get(), "NC");
}

std::string hex(const std::string& bytes) {
    std::string digits;
    for (const char c : bytes) {
        char two[3];
        snprintf(two, sizeof two, "%02x", static_cast<unsigned char>(c));
        digits += two;
    }
    return digits;
}

// What is in a seal, opened with report.key.
std::string open_seal(const std::string& key, const std::string& iv, const std::string& text) {
    write_file("sealed.key", key);
    const std::string plain_key = openssl("pkeyutl -decrypt -inkey report.key -in sealed.key");
    write_file("sealed.text", text);
    return openssl("enc -d -aes-128-cbc -K " + hex(plain_key) + " -iv " + hex(iv) +
                   " -in sealed.text");
}

kiv::Report open_report(const std::string& path) {
    EXPECT_TRUE(wait_until([&] { return exists(path); })) << path;
    const std::string file = read_file(path);
    EXPECT_TRUE(file.starts_with("\x0a\x08\x0a\0\x12\0\x1a\0\x22\0\x32"s));
    const kiv::Report sealed = parse(file);
    write_file("opened", open_seal(sealed.encryption_key(), sealed.encryption_iv(),
                                   sealed.encrypted_compressed_data()));
    return parse(gunzip_file("opened"));
}

TEST_F(configuration, the_kill_switch_stops_the_daemon_for_good) {
    const auto settings = own_part<kivd::Settings>("Settings", "permanently_disable: true");
    const auto once = own_part<kivd::RunActionsOnce>("RunActionsOnce", "remove_reports: true");
    daemon_process daemon = start();
    EXPECT_EQ(install(config_file({settings, once})), "1");
    EXPECT_EQ(daemon.wait_exit(), 0);
    EXPECT_FALSE(exists("output/kiv_disabled"));  // removed with all else there

    daemon = start();
    EXPECT_EQ(install(config_file({settings})), "1");
    EXPECT_EQ(daemon.wait_exit(), 0);
    EXPECT_TRUE(daemon.wait_log("I kivd-settings: Kill switch enabled"));
    EXPECT_TRUE(exists("output/kiv_disabled"));

    daemon = launch({{"-C"}});
    EXPECT_TRUE(daemon.wait_log("KIV will disable itself."));
    EXPECT_FALSE(connect_client(packets).ok());
    EXPECT_EQ(daemon.stop(), 0);
}

// In a mount namespace of its own, in which the system has what is installed on a device.
TEST_F(configuration, what_the_system_brings_is_installed_and_run) {
    std::error_code exists_already;
    std::filesystem::create_directory("/system", exists_already);
    if (getuid() != 0 || unshare(CLONE_NEWNS) != 0 ||
        mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr) != 0 ||
        mount("tmpfs", "/system", "tmpfs", 0, nullptr) != 0) {
        GTEST_SKIP() << "cannot have mounts of its own";
    }
    for (const char* path : {"/system/etc", "/system/bin"}) {
        std::filesystem::create_directory(path);
    }
    const std::string filter = "event_filter { type: INCLUDE }";
    const auto run = own_part<kivd::RunActions>("RunActions", "run_log_reader: true");
    write_file("/system/etc/kivd.conf",
               config_file({own_part<kiv::config::FilterConfig>("FilterConfig", filter), run}));
    daemon_process daemon = start();
    EXPECT_TRUE(daemon.wait_log("E kivd-conf: Failed to execute log reader: No such file"));
    EXPECT_EQ(ask(connect_client(packets).get(), "PA p event"), "0");
    EXPECT_EQ(daemon.stop(), 0);

    write_file("/system/bin/kiv-logreader",
               "#!/bin/sh\n"
               "echo \"$*\" $(env | grep -v -e PWD -e SHLVL -e _=) $(ls -l /proc/$$/fd | grep -c "
               "-e socket -e kivd.pid -e anon_inode) "
               "$(grep -e SigBlk -e SigIgn /proc/$$/status) >args\n"
               "echo $$ >pid.new; mv pid.new pid; exec sleep 1000\n");
    std::filesystem::permissions("/system/bin/kiv-logreader", std::filesystem::perms(0755));
    std::vector<int> readers;
    const auto runs = [](int pid) { return kill(pid, 0) == 0; };
    const auto wait_reader = [&] {
        EXPECT_TRUE(wait_until([&] { return exists("pid") && runs(std::stoi(read_file("pid"))); }));
        readers.push_back(std::stoi(read_file("pid")));
        std::filesystem::remove("pid");
    };
    write_file("/system/build.prop", "#x=1\nro.build.type=\nro.build.type=eng\r\n");
    // The filter file is there, so nothing is installed anew; the actions are those in force.
    write_file("/system/etc/kivd.conf", "");
    for (const bool test_mode : {false, true}) {
        daemon = start({{test_mode ? "-Ct" : "-C"}});
        wait_reader();
        EXPECT_EQ(read_file("args"), (test_mode ? "-s /data/kiv_run/ main"s : "main"s) +
                                         " 0 SigBlk: 0000000000000000 SigIgn: 0000000000000000\n");
        EXPECT_EQ(daemon.stop(), 0);
        EXPECT_TRUE(runs(readers.back()));  // it outlives the daemon, and keeps no lock
    }
    // Taken at the start, it starts a reader that the start's own run of the actions stops again.
    for (int round = 0; round < 10; ++round) {
        write_file("input/config", config_file({run}));
        EXPECT_EQ(start().stop(), 0);
        wait_reader();
        EXPECT_EQ(kill(readers.back(), SIGKILL), 0);
        readers.pop_back();
    }
    daemon = start();
    EXPECT_NE(read_file("private/kivd.state").find("build_type: eng\n"), std::string::npos);
    wait_reader();
    EXPECT_EQ(install(config_file({run})), "1");
    wait_reader();
    EXPECT_FALSE(runs(readers[2]));
    EXPECT_EQ(install(config_file({{"app", "part", ""}})), "1");
    EXPECT_TRUE(runs(readers[3]));
    EXPECT_EQ(install(config_file({own_part<kivd::RunActions>("RunActions", "")})), "1");
    EXPECT_FALSE(runs(readers[3]));
    for (const int pid : {readers[0], readers[1]}) EXPECT_EQ(kill(pid, SIGKILL), 0);
}

TEST_F(configuration, files_are_verified_and_sealed_from_the_command_line) {
    make_keys("config");
    make_keys("report", 2048);
    std::filesystem::create_directory("keys");
    for (const char* key : {"kiv_config.pem", "kiv_report.pem"}) {
        std::filesystem::rename(key, "keys/"s + key);
    }
    const auto run = [this](std::vector<std::string> arguments) {
        arguments.insert(arguments.begin(), {"-b", directory, "-c", directory + "/keys/"});
        daemon_process process(KIVD_PATH, {arguments});
        const int status = process.wait_exit();
        return std::to_string(status) + " " + process.output() + process.log();
    };
    write_file("file", "some data");
    write_file("file.sig", sign("some data", "config"));
    EXPECT_EQ(run({"--verify-config", "file", "--encrypt", "file"}), "42 Verified: OK\n");
    EXPECT_FALSE(exists("file.enc"));
    std::filesystem::create_directory("elsewhere");
    EXPECT_EQ(run({"-b", "elsewhere", "-c", "keys/", "--verify-config", "../file"}),
              "42 Verified: OK\n");
    write_file("none.sig", "");
    EXPECT_TRUE(run({"--verify-config=none"}).starts_with("33 Verified: Failure\n"));
    write_file("file", "other data");
    EXPECT_EQ(run({"--verify-config=file"}), "33 Verified: Failure\n");
    const std::string unkeyed = run({"-c", "NO_ENCRYPTION", "--verify-config=file"});
    EXPECT_TRUE(unkeyed.starts_with("33 Verified: Failure\n")) << unkeyed;
    EXPECT_NE(unkeyed.find("E kivd/crypto: Failed to load public key."), std::string::npos);

    for (const size_t size : {0, 15, 16, 17, 1023, 1024, 1025, 16384, 100000}) {
        SCOPED_TRACE(size);
        const std::string plain(size, 'x');
        write_file("file", plain);
        EXPECT_EQ(run({"--encrypt", "file"}), "0 ");
        const std::string sealed = read_file("file.enc");
        EXPECT_EQ(sealed.size(), size / 16 * 16 + 16);
        EXPECT_EQ(open_seal(read_file("file.key"), read_file("file.iv"), sealed), plain);
    }
    const daemon_process daemon = start({{"-C", "-c", directory + "/keys/"}});
    request({"EV p event x", "FL"});
    EXPECT_EQ(open_report("output/kiv_1").events_size(), 1);
    EXPECT_TRUE(run({"--encrypt", "none"}).starts_with("0 File not found.: No such file"));
    std::filesystem::create_directory("ec");
    EXPECT_EQ(system("openssl ecparam -genkey -name prime256v1 -noout | openssl ec -pubout "
                     "-out ec/kiv_report.pem 2>ec/errors"),
              0);
    const std::pair<std::string, std::string> unusable[] = {
        {"ec/", "E kivd/crypto: Report key is EC of 256 bits, not RSA of at most 4096 in whole"},
        {directory, "W kivd: No key can be read in " + directory + ": is the last / missing?"},
        {directory, "E kivd/crypto: Failed to open report key"},
    };
    for (const auto& [keys, text] : unusable) {
        const std::string log = run({"-c", keys, "--encrypt", "file"});
        EXPECT_NE(log.find(text), std::string::npos) << log;
    }
}

// Sanitizers find the real one first.
#if !defined(__SANITIZE_ADDRESS__) && !defined(__SANITIZE_THREAD__)
TEST_F(configuration, nothing_is_reported_or_taken_without_the_module_for_keys) {
    std::filesystem::create_directory("broken");
    write_file("broken/kivd-crypto.so", "");
    EXPECT_EQ(setenv("LD_LIBRARY_PATH", (directory + "/broken").c_str(), 1), 0);
    make_keys("report");
    daemon_process daemon = start({{"-C", "-c", directory + "/"}});
    EXPECT_TRUE(daemon.wait_log("E kivd/crypto: Failed to load the module for keys: "));
    request({"EV p event x", "FL"});
    EXPECT_TRUE(daemon.wait_log("E kivd-compactor: Failed to initialize encryption."));
    EXPECT_EQ(install(config_file({{"app", "part", "x"}})), "0");
    EXPECT_TRUE(report_paths().empty());
    EXPECT_EQ(daemon.stop(), 0);
    EXPECT_EQ(unsetenv("LD_LIBRARY_PATH"), 0);
}
#endif

}  // namespace
}  // namespace kivd
