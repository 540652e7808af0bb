// kivctl with the real daemon, where a stand-in would not do.
#include "debug_port.h"

namespace kivd {
namespace {

// kivctl watch.
class debug_watch : public debug_port_test {
 protected:
    [[nodiscard]] daemon_process watch(const std::vector<std::string>& options = {}) const {
        std::vector<std::string> arguments = {"--base", directory, "watch"};
        arguments.insert(arguments.end(), options.begin(), options.end());
        return {KIVCTL_PATH, {arguments}};
    }
};

// Sends the requests, and an IA behind them, until the watcher has shown the line: what comes
// before the daemon has met the watcher is shown to nobody.
bool wait_shown(const daemon_process& watcher, const std::string& line,
                const std::vector<std::string>& requests = {}) {
    return wait_until([&] {
        request(requests);
        return watcher.output().find(line) != std::string::npos;
    });
}

TEST_F(debug_watch, shows_requests_until_it_is_told_to_end_or_the_connection_is_closed) {
    daemon_process daemon = start({{"-C", "-d"}});
    daemon_process first = watch();
    EXPECT_TRUE(
        wait_shown(first, "  15  EV  app start  2 bytes: 01 FF\n", {"EV app start \x01\xff"}));
    daemon_process second = watch({"--package", "app"});
    EXPECT_EQ(first.wait_exit(), 3);
    EXPECT_TRUE(first.log().starts_with("kivctl: another client has taken the place"));
    EXPECT_TRUE(wait_shown(second, "CS  app starts  2\n", {"CS app starts 2"}));
    request({"EV apple n x", "EV ap n x", "EV app last x"});
    EXPECT_TRUE(
        wait_until([&] { return second.output().find("EV  app last") != std::string::npos; }));
    second.send_signal(SIGINT);
    EXPECT_EQ(second.wait_exit(), 0);
    EXPECT_EQ(second.log(), "");
    EXPECT_EQ(second.output().find("EV  ap"), second.output().find("EV  app last"));
    EXPECT_EQ(second.output().find("IA"), std::string::npos);

    const std::string frame = doc_example("requests.md", "hex", "debug-frame");
    daemon_process third = watch({"--raw"});
    EXPECT_TRUE(wait_shown(third, frame + frame));
    EXPECT_TRUE(third.output().starts_with(frame));
    EXPECT_EQ(third.stop(), 0);

    // one whose output is read no further, with nothing more to be shown
    const std::string command = std::string("{ ") + KIVCTL_PATH + " watch; echo $? >status; } | ";
    daemon_process closed("/bin/sh", {{"-c", command + "head -c 3"}});
    EXPECT_TRUE(wait_shown(closed, "-"));
    EXPECT_EQ(closed.wait_exit(), 0);
    EXPECT_EQ(read_file("status"), "0\n");

    daemon_process last = watch();
    EXPECT_TRUE(wait_shown(last, "IA\n"));
    EXPECT_EQ(daemon.stop(), 0);
    EXPECT_EQ(last.wait_exit(), 3);
    EXPECT_TRUE(last.log().starts_with("kivctl: the daemon has ended"));
    EXPECT_EQ(start({{"-d"}}).stop(), 0);  // nothing of the connection holds the port
}

TEST_F(debug_watch, tells_why_there_is_nothing_to_see) {
    daemon_process nothing = watch();
    EXPECT_EQ(nothing.wait_exit(), 3);
    EXPECT_NE(nothing.log().find("started with the option -d"), std::string::npos);

    daemon_process daemon = start();  // has no debug interface
    const unique_fd listener = listen_there();
    const struct {
        std::string sent;
        int status;
        const char* text;
    } cases[] = {
        {"HTTP/1.1 400 Bad Request\r\n", 1, "no frame of a debug interface"},
        {std::string("\0\0\0\4\x0a\2I", 7), 3, "faster than they were shown"},
    };
    for (const auto& c : cases) {
        daemon_process watcher = watch();
        const unique_fd connection(accept4(listener.get(), nullptr, nullptr, SOCK_CLOEXEC));
        EXPECT_TRUE(send_text(connection.get(), c.sent));
        // The end that hangs up first keeps the port for a while, unless kivctl then sees to it.
        if (c.status == 3) {
            EXPECT_EQ(shutdown(connection.get(), SHUT_WR), 0);
        }
        EXPECT_EQ(watcher.wait_exit(), c.status);
        EXPECT_NE(watcher.log().find(c.text), std::string::npos) << watcher.log();
    }
}

}  // namespace
}  // namespace kivd
