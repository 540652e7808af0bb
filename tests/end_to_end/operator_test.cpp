// kivctl for those who look after a daemon: status, check, and how long each command may take.
#include <sys/stat.h>

#include <regex>

#include "debug_port.h"
#include "support/config_package.h"

namespace kivd {
namespace {

class operator_commands : public daemon_test {
 protected:
    // As whom the daemon runs: root could read every key.
    const uid_t daemon_user = geteuid() == 0 ? 65534 : 0;

    void SetUp() override {
        EXPECT_EQ(system("mkdir keys input"), 0);
        for (const char* name : {"report", "config"}) {
            make_keys(name, 2048);
            std::filesystem::rename("kiv_" + std::string(name) + ".pem",
                                    "keys/kiv_" + std::string(name) + ".pem");
        }
        const std::string package = gzip(pack({own_part<kiv::config::FilterConfig>(
            "FilterConfig",
            R"(event_filter { type: EXCLUDE item { package: "shop" name: "debug" } })")}));
        write_file("input/config", config_file(package, sign(package, "config")));
        if (daemon_user != 0) {
            EXPECT_EQ(system(("chown -R " + std::to_string(daemon_user) + " .").c_str()), 0);
        }
    }

    [[nodiscard]] daemon_process start_with_keys(const std::string& keys = "/keys/") const {
        return start({{"-C", "-c", directory + keys}, 0, daemon_user});
    }

    [[nodiscard]] daemon_process kivctl(std::vector<std::string> arguments, uid_t uid = 0) const {
        arguments.insert(arguments.begin(), {"--base", directory});
        return {KIVCTL_PATH, {arguments, 0, uid}};
    }

    // The ids of what is found, and how `check` ends.
    [[nodiscard]] std::pair<std::string, int> check() const {
        daemon_process tool = kivctl({"check", "--json"});
        const int status = tool.wait_exit();
        std::string ids;
        const std::string output = tool.output();
        const std::regex id(R"re("id":"(\w+)")re");
        for (std::sregex_iterator each(output.begin(), output.end(), id), end; each != end;
             ++each) {
            ids += (ids.empty() ? "" : " ") + (*each)[1].str();
        }
        return {ids, status};
    }
};

TEST_F(operator_commands, each_damage_is_found_and_nothing_else) {
    daemon_process daemon = start_with_keys();
    EXPECT_EQ(chmod("kivd.pid", 0600), 0);
    const std::string key = "keys/kiv_report.pem", config_key = "keys/kiv_config.pem";
    const std::string record = "; printf '\\0\\0\\n' >>private/sdata.txt";
    const auto fill = [](int size) {
        return "head -c " + std::to_string(size) + " /dev/zero | tr '\\0' ";
    };
    const auto guard = [](int errors, int age) {
        return "sed -i 's/^error_nr.*/error_nr: " + std::to_string(errors) +
               "/; s/^error_time.*/error_time: '$(($(date +%s)-" + std::to_string(age) +
               "))/ private/kivd.state";
    };
    const struct {
        std::string damage;  // a command; all files are as before afterwards
        std::string found;   // empty for nothing
    } cases[] = {
        {"true", ""},
        {"rm " + key, "report_key_off"},
        {"chmod 0 keys", "report_key_off config_key_off"},
        {"echo >" + key, "report_key_unusable"},
        {"openssl ecparam -genkey -name prime256v1 -noout | openssl ec -pubout >" + key,
         "report_key_unusable"},
        {"openssl ecparam -genkey -name prime256v1 -noout | openssl ec -pubout >" + config_key, ""},
        {"openssl genpkey -algorithm ed25519 | openssl pkey -pubout >" + config_key,
         "config_key_unusable"},
        {"rm " + config_key, "config_key_off"},
        {"touch output/kiv_disabled", "disabled"},
        {"touch output/kiv_7", ""},
        {"touch 'output/\"\n\\'", "bad_file"},
        {"mkdir output/kiv_7", "bad_file"},
        {"touch private/counters.txt_", "stale_temporary"},
        {"touch private/new_config.gz", "stale_temporary"},
        {"touch private/flushed_data", "unsent_report"},
        {"rm private/filters.txt", "filter"},
        {"printf '__type\\0exclude\\0\\0\\n' >private/filters.txt", "filter"},
        {"printf '*\\0*\\0\\0\\n' >private/filters.txt", "filter"},
        {"printf 'a\\0*\\0\\0\\n' >private/filters.txt", ""},
        {fill(1021) + "x >private/sdata.txt" + record, ""},
        {fill(1022) + "x >private/sdata.txt" + record, "list_file"},
        {"for i in $(seq 20000); do printf 'x\\0\\0\\n'; done >private/sdata.txt", ""},
        {"for i in $(seq 20001); do printf 'x\\0\\0\\n'; done >private/sdata.txt", "list_file"},
        {"for i in $(seq 20000); do printf 'x\\0\\0\\n'; done >private/filters.txt", "list_file"},
        {guard(99, 0), ""},
        {guard(100, 35000), "error_guard"},
        {guard(100, 36100), ""},
        {"truncate -s 368639 private/events", ""},
        {"truncate -s 368640 private/events", "partial_file"},
        {"truncate -s 4349951 output/kiv_1", ""},
        {"truncate -s 4349952 output/kiv_1", "output_size"},
        {"sed -i 's/^data-collection.*/data-collection: 0/' private/kivd.state", "collection_off"},
        {"chmod 600 kiv_co_stream", "socket"},
        {"chmod 604 kivd.pid", "lock_file"},
        {"chmod 602 kivd.pid", "lock_file"},
        {"chmod 604 kivd.pid; chmod 710 .", ""},
    };
    EXPECT_EQ(system("tar cf all.tar keys private output"), 0);
    for (const auto& c : cases) {
        SCOPED_TRACE(c.damage);
        EXPECT_EQ(system(("( " + c.damage + " ) 2>/dev/null").c_str()), 0);
        EXPECT_EQ(check(), std::pair(c.found, c.found.empty() ? 0 : 1));
        daemon_process tool = kivctl({"check"});
        EXPECT_EQ(tool.wait_exit(), c.found.empty() ? 0 : 1);
        const std::string first = c.found.substr(0, c.found.find(' '));
        EXPECT_TRUE(tool.output().starts_with(first.empty() ? "all is well\n" : first + ": "))
            << tool.output();
        EXPECT_EQ(system("rm -r keys private output; tar xpf all.tar; "
                         "chmod 755 .; chmod 600 kivd.pid; chmod 622 kiv_co_stream"),
                  0);
    }
}

TEST_F(operator_commands, status_tells_what_can_be_known_from_where_it_runs) {
    daemon_process daemon = start_with_keys();
    write_file("output/kiv_7", "12345");
    write_file("private/events", "123");
    const std::pair<std::string, std::string> changing[] = {
        {directory, "DIR"},
        {"\"pid\":" + std::to_string(daemon.pid()) + ",", "PID,"},
        {read_file("private/kivd.state").substr(17, 40), "SUM"},
        {"(\\d+\\.\\d+ ms|\\d+ bytes and \\d+ inodes|[-\\d]+ \\d\\d:\\d\\d:\\d\\d)", "#"},
        {"process \\d+", "process PID"},
        {"(answer_us\"|inodes\"|saved_at\"|space\":\\{\"size\"):\\d+", "$1:#"},
    };
    const auto status = [&](uid_t uid, const std::vector<std::string>& more = {"--json"}) {
        std::vector<std::string> arguments = {"status"};
        arguments.insert(arguments.end(), more.begin(), more.end());
        daemon_process tool = kivctl(arguments, uid);
        std::string text = std::to_string(tool.wait_exit());
        text += tool.output();
        for (const auto& [what, by] : changing) {
            text = std::regex_replace(text, std::regex(what), by);
        }
        return text;
    };
    EXPECT_EQ(status(daemon_user),
              R"(0{"directory":"DIR","running":true,PID,"stopped":false,"lock_held":true,)"
              R"("answers":true,"answer_us":#,"collection":true,"diagnostics":false,)"
              R"("partial_file":{"size":3,"limit":409600},)"
              R"("reports":{"count":1,"lowest":7,"highest":7},"output":{"size":5,"limit":4833280},)"
              R"("free_space":{"size":#,"needed":1331200,"inodes":#},"keys_from":"command_line",)"
              R"("sealing":{"on":true,"key":"usable","path":"DIR/keys/kiv_report.pem"},)"
              R"("verification":{"on":true,"key":"usable","path":"DIR/keys/kiv_config.pem"},)"
              R"("config_checksum":"SUM","error_guard":{"used":0,"limit":100,)"
              R"("suppressed":false,"suppressed_until":null,"saved_at":#}})"
              "\n");
    EXPECT_EQ(status(daemon_user, {}),
              "0directory       DIR\n"
              "running         yes, process PID\n"
              "answers         yes, in #\n"
              "collection      on\n"
              "diagnostics     off\n"
              "partial file    3 of 409600 bytes (0 %)\n"
              "reports         1, kiv_7 to kiv_7\n"
              "output size     5 of 4833280 bytes (0 %)\n"
              "free space      #, needed: 1331200 bytes\n"
              "sealing         on, with DIR/keys/kiv_report.pem\n"
              "verification    on, with DIR/keys/kiv_config.pem\n"
              "configuration   SUM\n"
              "error guard     0 of 100 error events used, as saved at #\n");
    if (daemon_user != 0) {
        const std::string seen = status(1);  // who sees no more than that it runs
        for (const char* part : {R"("running":true,PID,"stopped":false,"lock_held":true)",
                                 R"("collection":null,"diagnostics":null)",
                                 R"("partial_file":{"size":null,"limit":null})",
                                 R"("output":{"size":5,"limit":null})", R"("used":null)"}) {
            EXPECT_NE(seen.find(part), std::string::npos) << part << seen;
        }
    }
    EXPECT_EQ(daemon.stop(), 0);
    EXPECT_TRUE(status(0).starts_with(R"(3{"directory":"DIR","running":false,)")) << status(0);
}

TEST_F(operator_commands, every_command_ends_in_time_when_the_daemon_is_stopped) {
    const unique_fd port_lock = lock_debug_port();
    daemon_process daemon = launch({{"-C", "-d"}});
    if (!daemon.wait_ready()) GTEST_SKIP() << "port 2305 is in use";
    write_file("config", "c");
    daemon.send_signal(SIGSTOP);
    const std::vector<std::vector<std::string>> commands = {
        {"alive"},
        {"flush"},
        {"wanted", "p", "n"},
        {"config", "install", "config"},
        {"config", "get", "p", "n"},
        {"remove-report", "all"},
        {"group", "add", "x"},
        {"files", "list"},
        {"files", "get", "1"},
        {"status"},
        {"check", "--json"},
        {"watch"},
        {"watch", "--host", "localhost"},
    };
    std::vector<daemon_process> tools;
    for (const auto& command : commands) tools.push_back(kivctl(command));
    for (size_t i = 0; i < tools.size(); ++i) {
        EXPECT_EQ(tools[i].wait_exit(), 3) << commands[i].front() << tools[i].log();
    }
    // data is done when it is in the daemon's queue, and then there is no more room
    int status = 0;
    for (int i = 0; i < 2000 && status == 0; ++i) {
        status = kivctl({"--timeout", "50", "event", "p", "n"}).wait_exit();
    }
    EXPECT_EQ(status, 3);
    daemon.send_signal(SIGCONT);
    EXPECT_EQ(daemon.stop(), 0);
}

}  // namespace
}  // namespace kivd
