// Starting, stopping and starting again.
#include <fcntl.h>
#include <sys/prctl.h>
#include <sys/stat.h>

#include <csignal>

#include "daemon_test.h"

namespace kivd {
namespace {

using namespace std::string_literals;

class life : public daemon_test {};

void expect_clean_stop(daemon_process& daemon) {
    EXPECT_EQ(daemon.stop(), 0) << daemon.log();
    for (const char* name : {"kivd.pid", "kiv_cl", "kiv_co", "kiv_co_stream"}) {
        EXPECT_FALSE(exists(name)) << name;
    }
}

TEST_F(life, refuses_a_command_line_or_directory_it_cannot_work_with) {
    write_file("file", "");
    std::filesystem::create_directories("lock_taken/kivd.pid");
    std::filesystem::create_directories("socket_taken/kiv_co");
    const struct {
        std::vector<std::string> arguments;
        int status;
        const char* output;
        const char* log;
    } cases[] = {
        {{"-h"}, 2, "Syntax: kivd [OPTIONS]\n\n  -h, --help             give this help list\n", ""},
        {{"-D", "--help", "-b", "nowhere"}, 2, "NO_ENCRYPTION to turn off encryption.\n\n", ""},
        {{"-h", "-c", "nowhere"}, 1, "", "E kivd: Certificate path does not exist!"},
        {{"-D", "-b", "nowhere"},
         1,
         "Will not detach (or already detached)\n",
         "E kivd: Could not chdir(nowhere), and errno is No such file or directory"},
        {{"-D", "-b", "file"}, 1, "", "Could not chdir(file), and errno is Not a directory"},
        {{"-D", "-b", "lock_taken"}, 1, "", "Failed to open lock file kivd.pid, and errno is Is a"},
        {{"-D", "-b", "socket_taken"}, 1, "", "Failed to unlink socket: Is a directory"},
    };
    for (const auto& each : cases) {
        SCOPED_TRACE(testing::PrintToString(each.arguments));
        daemon_process daemon(KIVD_PATH, {each.arguments});
        EXPECT_EQ(daemon.wait_exit(), each.status);
        EXPECT_NE(daemon.output().find(each.output), std::string::npos) << daemon.output();
        EXPECT_NE(daemon.log().find(each.log), std::string::npos) << daemon.log();
    }
}

TEST_F(life, goes_on_with_what_it_understands_of_its_options) {
    daemon_process daemon = start({{"-x", "--unknown", "-s", "0", "-s", "99999999999", "-e"}});
    EXPECT_EQ(read_file("kivd.pid"), std::to_string(daemon.pid()) + "\n");
    EXPECT_TRUE(daemon.wait_idle());  // whatever the save intervals were
    expect_clean_stop(daemon);
}

// From a relative directory, so that it has to find its own sockets after the change of directory.
TEST_F(life, detached_daemon_serves_on_in_a_session_of_its_own) {
    ASSERT_EQ(prctl(PR_SET_CHILD_SUBREAPER, 1), 0);
    daemon_process parent(KIVD_PATH, {{"-b", ".", "-C", "-c", "NO_ENCRYPTION"}});
    EXPECT_EQ(parent.wait_exit(), 0);
    ASSERT_TRUE(wait_until([] { return connect_client(socket_kind::stream).ok(); }));
    daemon_process daemon(std::stoi(read_file("kivd.pid")));
    EXPECT_EQ(getsid(daemon.pid()), daemon.pid());
    for (const char* fd : {"0", "1", "2"}) {
        const std::string link = "/proc/" + std::to_string(daemon.pid()) + "/fd/" + fd;
        EXPECT_EQ(std::filesystem::read_symlink(link), "/dev/null");
    }
    request({"XY"});
    EXPECT_TRUE(wait_until([] {
        request({"FS"});
        return read_file("private/counters.txt").starts_with("kiv\0Cnt_DaemonError"s);
    }));
    expect_clean_stop(daemon);
}

TEST_F(life, disable_marker_keeps_it_waiting_for_its_end) {
    std::filesystem::create_directory("output");
    write_file("output/kiv_disabled", "");
    daemon_process daemon = launch({});
    ASSERT_TRUE(daemon.wait_log("E kivd-util: KIV will disable itself."));
    EXPECT_TRUE(daemon.wait_idle());
    EXPECT_FALSE(exists("kiv_co"));
    EXPECT_EQ(launch({}).wait_exit(), 1);
    expect_clean_stop(daemon);
    EXPECT_TRUE(daemon.wait_log("I kivd: Exiting."));
    EXPECT_TRUE(exists("output/kiv_disabled"));
}

TEST_F(life, what_was_kept_survives_a_stop) {
    daemon_process daemon = start();
    request({"CI p counter 5", "SD p static some text", "EV p event \0payload"s, "SG group"});
    const std::string device_id = ask(connect_client(socket_kind::packets).get(), "GD");
    EXPECT_EQ(device_id.size(), 36U);
    expect_clean_stop(daemon);

    // That data are collected comes from the state file.
    daemon = start({});
    EXPECT_EQ(ask(connect_client(socket_kind::packets).get(), "GD"), device_id);
    request({"FL"});
    const kiv::Report report = wait_report(1);
    EXPECT_EQ(report.header().device_id(), device_id);
    ASSERT_EQ(report.counters_size(), 1);
    EXPECT_EQ(report.counters(0).value(), 5);
    ASSERT_EQ(report.statics_size(), 1);
    EXPECT_EQ(report.statics(0).value(), "some text");
    ASSERT_EQ(report.events_size(), 1);
    EXPECT_EQ(report.events(0).payload(), "\0payload"s);
    request({"EV p event now with the group", "FL"});
    const kiv::Report next = wait_report(2);
    ASSERT_EQ(next.header().group_id_size(), 1);
    EXPECT_EQ(next.header().group_id(0), "group");
    EXPECT_EQ(next.counters_size() + next.statics_size(), 0);

    expect_clean_stop(daemon);
    EXPECT_EQ(errors(daemon), 0U) << daemon.log();
}

// The compactor hangs on a pipe in the place of its own file until the test reads it.
class with_held_compactor : public life {
 protected:
    with_held_compactor() {
        std::filesystem::create_directory("private");
        EXPECT_EQ(mkfifo(pipe_name, 0600), 0);
    }
    ~with_held_compactor() override { let_go(); }

    // Gives the report that the compactor has written.
    static std::string let_go() {
        if (!exists(pipe_name)) return "";
        const unique_fd pipe(open(pipe_name, O_RDONLY | O_NONBLOCK | O_CLOEXEC));
        std::string bytes(65536, '\0');
        size_t size = 0;
        (void)wait_until([&] {
            const bool is_complete = !exists(pipe_name);
            const ssize_t n = read(pipe.get(), bytes.data() + size, bytes.size() - size);
            if (n > 0) size += static_cast<size_t>(n);
            return is_complete;
        });
        bytes.resize(size);
        return bytes;
    }

    static constexpr char pipe_name[] = "private/flushed_data.compacted";
};

TEST_F(with_held_compactor, stop_waits_for_every_report_under_way) {
    daemon_process daemon = start();
    request({"EV p first x", "FL", "EV p second x"});
    const unique_fd client = connect_client(socket_kind::packets);
    ASSERT_TRUE(send_text(client.get(), "FL"));
    ASSERT_TRUE(wait_until([&] { return daemon.count_in_log("Generating Report...") == 2; }));
    daemon.send_signal(SIGTERM);  // now it waits for the first compactor
    daemon.send_signal(SIGINT);
    EXPECT_TRUE(daemon.wait_idle());
    EXPECT_TRUE(exists("private/events"));

    write_file("first.gz", let_go());
    EXPECT_EQ(parse(gunzip_file("first.gz")).events(0).name(), "first");
    EXPECT_EQ(daemon.wait_exit(), 0);
    EXPECT_EQ(parse(gunzip_file("output/kiv_2")).events(0).name(), "second");
    EXPECT_LT(daemon.log().rfind("Compactor all done."), daemon.log().find("Exiting."));
    EXPECT_EQ(daemon.count_in_log("Compactor all done."), 2U);
    for (const char* name : {"private/flushed_data", pipe_name}) EXPECT_FALSE(exists(name)) << name;
}

TEST_F(with_held_compactor, after_a_kill_a_new_start_is_refused_until_its_report_is_done) {
    daemon_process daemon = start();
    request({"EV p event x", "FL"});
    daemon.send_signal(SIGKILL);
    EXPECT_EQ(daemon.wait_exit(), 128 + SIGKILL);
    daemon_process refused = launch({});
    EXPECT_EQ(refused.wait_exit(), 1);
    EXPECT_EQ(refused.count_in_log("Another kivd is already running"), 1U);

    write_file("first.gz", let_go());
    EXPECT_EQ(parse(gunzip_file("first.gz")).events_size(), 1);
    daemon = start();
    EXPECT_TRUE(exists("output/kiv_1"));
}

TEST_F(life, test_mode_makes_the_same_reports_every_time) {
    std::vector<std::string> runs[2];
    for (std::vector<std::string>& run : runs) {
        const start_options options = {{"-C", "-t"}};
        daemon_process daemon = start(options);
        request({"CI p counter 5", "SD p static text", "EV p event first", "FL"});
        (void)wait_report(1);
        request({"EV p event second", "CS p other 1", "FL", "FL"});
        (void)wait_report(3);
        expect_clean_stop(daemon);
        daemon = start(options);
        request({"CI p counter 1", "EV p event third", "FL"});
        (void)wait_report(4);
        expect_clean_stop(daemon);
        for (const auto& [number, path] : report_paths()) run.push_back(gunzip_file(path));
        EXPECT_EQ(parse(run.back()).header().product_id(), "test_id");
        EXPECT_EQ(parse(run.back()).counters_size(), 1);
        remove_everything_kept();
    }
    EXPECT_EQ(runs[0].size(), 4U);
    EXPECT_EQ(runs[0], runs[1]);
}

}  // namespace
}  // namespace kivd
