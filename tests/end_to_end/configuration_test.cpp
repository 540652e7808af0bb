// A configuration's whole life, and what it makes of the reports. Keys, signatures and seals are
// openssl's on the other side.
#include <fcntl.h>
#include <sched.h>
#include <sys/mount.h>

#include <chrono>
#include <random>
#include <thread>

#include "client/kiv.h"
#include "daemon_test.h"
#include "settings.pb.h"
#include "support/config_package.h"

namespace kivd {
namespace {

using namespace std::string_literals;
using enum socket_kind;

class configuration : public daemon_test {
 protected:
    // With the keys of the test's directory, as far as there are any.
    [[nodiscard]] daemon_process start_with_keys() const {
        return start({{"-C", "-c", directory + "/"}});
    }
};

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

TEST_F(configuration, a_signed_one_rules_what_is_kept_and_what_leaves_is_sealed) {
    make_keys("config");
    make_keys("report", 2048);
    const std::string data = gzip(pack(
        {own_part<kiv::config::FilterConfig>(
             "FilterConfig", "event_filter { type: EXCLUDE item { package: 'p' name: 'secret' } }"),
         own_part<kivd::Settings>("Settings", "max_report_size: 1000"),
         {"app", "part", "for the app"}}));
    const std::string file = config_file(data, sign(data, "config"));

    daemon_process daemon = start_with_keys();
    EXPECT_EQ(install(config_file(data)), "0");
    EXPECT_EQ(daemon.count_in_log("E kivd-conf: Failed to verify configuration"), 1U);
    EXPECT_EQ(install(file), "1");
    for (const bool restarted : {false, true}) {
        SCOPED_TRACE(restarted);
        const unique_fd client = connect_client(packets);
        EXPECT_EQ(ask(client.get(), "PA p secret") + ask(client.get(), "PA p open"), "01");
        EXPECT_EQ(ask(client.get(), "GC app other"), "FAIL");
        kiv_handle* const kiv = kiv_create_from_path(directory.c_str());
        const unique_fd part(kiv_get_config(kiv, "app", "part"));
        kiv_destroy(kiv);
        EXPECT_EQ(fcntl(part.get(), F_GETFL) & O_ACCMODE, O_RDONLY);
        char text[32] = {};
        EXPECT_EQ(read(part.get(), text, sizeof text), 11);
        EXPECT_STREQ(text, "for the app");
        if (restarted) break;
        request({"EV p secret x", "EV p open y", "FL"});
        EXPECT_EQ(daemon.stop(), 0);
        daemon = start_with_keys();
    }
    kiv::Report report = open_report("output/kiv_1");
    ASSERT_EQ(report.events_size(), 3);  // two of them say why the first one was refused
    EXPECT_EQ(report.events(2).payload(), "y");
    request({"EV p open " + std::string(1000, 'z')});  // of the report size
    EXPECT_EQ(open_report("output/kiv_2").events_size(), 1);
    const kiv::Report sealed[] = {parse(read_file("output/kiv_1")),
                                  parse(read_file("output/kiv_2"))};
    EXPECT_NE(sealed[0].encryption_key(), sealed[1].encryption_key());
    EXPECT_NE(sealed[0].encryption_iv(), sealed[1].encryption_iv());
    EXPECT_FALSE(exists("private/flushed_data.encrypted"));
}

TEST_F(configuration, a_key_that_cannot_seal_lets_no_report_out) {
    const daemon_process daemon = start_with_keys();
    const std::pair<const char*, const char*> keys[] = {
        {"8192 bits", "genpkey -algorithm RSA -pkeyopt rsa_keygen_bits:4104 -out report.key"},
        {"EC", "ecparam -genkey -name prime256v1 -noout -out report.key"},
        {"none", nullptr},
    };
    size_t refused = 0;
    for (const auto& [kind, make] : keys) {
        SCOPED_TRACE(kind);
        if (make != nullptr) {
            openssl(make);
            openssl("pkey -in report.key -pubout -out kiv_report.pem");
        } else {
            write_file("kiv_report.pem", "no key");
        }
        request({"EV p event x", "FL"});
        ++refused;
        EXPECT_TRUE(wait_until([&] {
            return daemon.count_in_log("E kivd/crypto: Failed to open report key") == refused &&
                   daemon.count_in_log("E kivd-compactor: Failed to initialize encryption.") ==
                       refused;
        })) << daemon.log();
        EXPECT_TRUE(report_paths().empty());
    }
}

TEST_F(configuration, a_kill_leaves_the_old_one_or_the_new_one) {
    std::minstd_rand random(1);
    std::string files[2];
    for (const int which : {0, 1}) {
        std::vector<config_part> parts;
        for (int i = 0; i < 100; ++i) {
            parts.push_back({"p", std::to_string(i), std::string(200, which == 0 ? 'a' : 'b')});
        }
        files[which] = config_file(parts);
    }
    daemon_process daemon = start();
    ASSERT_EQ(install(files[0]), "1");
    for (int round = 0; round < 20; ++round) {
        {
            const unique_fd client = connect_client(packets);
            EXPECT_TRUE(send_text(client.get(), "WC " + files[round % 2]));
            EXPECT_TRUE(send_text(client.get(), "NC"));
            std::this_thread::sleep_for(std::chrono::microseconds(random() % 6000));
        }
        daemon.send_signal(SIGKILL);
        (void)daemon.wait_exit();
        daemon = start();
        EXPECT_TRUE(std::filesystem::is_empty("input"));
        std::string all;
        for (int id = 1; id <= 100; ++id) {
            all += read_file("private/conf_" + std::to_string(id) + ".bin");
        }
        ASSERT_EQ(all, std::string(20000, all.front())) << round;
    }
    EXPECT_EQ(install(files[1]), "1");
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
    EXPECT_TRUE(run({"--encrypt", "none"}).starts_with("0 File not found.: No such file"));
    EXPECT_TRUE(run({"-c", directory, "--encrypt", "file"})  // no "/" at its end
                    .find("E kivd/crypto: Failed to open report key") != std::string::npos);
}

}  // namespace
}  // namespace kivd
