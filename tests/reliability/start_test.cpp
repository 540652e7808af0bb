// Whatever state its parent has left it in.
#include <fcntl.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

#include <csignal>

#include "end_to_end/daemon_test.h"

namespace kivd {
namespace {

class started_daemon : public daemon_test {};

// What a pipe holds by now.
std::string drain(const char* path) {
    const unique_fd pipe(open(path, O_RDONLY | O_NONBLOCK | O_CLOEXEC));
    std::string text(1 << 17, '\0');
    const ssize_t size = read(pipe.get(), text.data(), text.size());
    text.resize(static_cast<size_t>(std::max<ssize_t>(size, 0)));
    return text;
}

// Sees to the daemon that detached itself, which then is this process's child.
daemon_process behind(daemon_process starter) {
    EXPECT_EQ(starter.wait_exit(), 0);
    EXPECT_TRUE(wait_until([] { return connect_client(socket_kind::stream).ok(); }));
    return daemon_process(std::stoi(read_file("kivd.pid")));
}

TEST_F(started_daemon, serves_and_stops_whatever_it_is_started_from) {
    const struct {
        const char* name;
        const char* preparation;
    } cases[] = {
        {"usual", ""},
        {"highest limit of descriptors", "ulimit -n $(cat /proc/sys/fs/nr_open)"},
        {"standard descriptors closed", "exec <&- >&- 2>&-"},
        {"signals ignored", "trap '' TERM INT HUP PIPE CHLD ALRM"},
        {"log that nobody reads", "mkfifo log; exec 2<>log"},
    };
    ASSERT_EQ(prctl(PR_SET_CHILD_SUBREAPER, 1), 0);
    for (const auto& each : cases) {
        for (const bool is_detached : {false, true}) {
            SCOPED_TRACE(each.name);
            daemon_process daemon("/bin/sh",
                                  {{"-c", each.preparation + "\nexec \"$0\" \"$@\""s, KIVD_PATH,
                                    is_detached ? "-C" : "-CD", "-b", ".", "-c", "NO_ENCRYPTION"}});
            if (is_detached) {
                daemon = behind(std::move(daemon));
                EXPECT_EQ(getsid(daemon.pid()), daemon.pid());
            }
            ASSERT_TRUE(wait_until([] { return connect_client(socket_kind::stream).ok(); }));
            for (const char* fd : {"0", "1", "2"}) {
                EXPECT_TRUE(exists("/proc/" + std::to_string(daemon.pid()) + "/fd/" + fd));
            }
            for (const int signal : {SIGHUP, SIGPIPE, SIGQUIT, SIGUSR1, SIGUSR2, SIGALRM, SIGCHLD,
                                     SIGIO, SIGPROF, SIGVTALRM, SIGXCPU, SIGXFSZ}) {
                daemon.send_signal(signal);
            }
            request(std::vector<std::string>(150, "EV " + std::string(1000, 'x')));  // fills a pipe
            request({"EV p event x", "FL"});
            EXPECT_GT(wait_report(1).events_size(), 0);
            std::filesystem::remove("output/kiv_1");
            if (!is_detached && exists("log")) {
                EXPECT_EQ(drain("log").find("were lost here"), std::string::npos);
                request({"XY"});
                EXPECT_NE(drain("log").find(" log lines were lost here\n"), std::string::npos);
            }
            daemon.send_signal(SIGINT);
            EXPECT_EQ(daemon.wait_exit(), 0) << daemon.log();
            for (const char* name : {"kivd.pid", "kiv_cl", "kiv_co", "kiv_co_stream"}) {
                EXPECT_FALSE(exists(name)) << name;
            }
        }
    }
}

TEST_F(started_daemon, leaves_its_files_to_those_they_are_for) {
    umask(0);
    daemon_process daemon = start();
    request({"EV p n x", "CI p c 1", "FL", "EV p n x", "FS"});
    (void)wait_report(1);
    const std::map<std::string, unsigned> modes = {{"input", 0755},
                                                   {"output", 0755},
                                                   {"output/kiv_1", 0644},
                                                   {"private", 0700},
                                                   {"private/events", 0700},
                                                   {"private/kivd.state", 0644},
                                                   {"private/counters.txt", 0644},
                                                   {"kivd.pid", 0644},
                                                   {"kiv_cl", 0622},
                                                   {"kiv_co", 0622},
                                                   {"kiv_co_stream", 0622}};
    for (const auto& [path, mode] : modes) {
        struct stat status = {};
        EXPECT_EQ(stat(path.c_str(), &status), 0) << path;
        EXPECT_EQ(status.st_mode & 0777U, mode) << path;
    }
    EXPECT_EQ(daemon.stop(), 0);
}

TEST_F(started_daemon, tells_the_service_manager_when_it_serves_and_when_it_stops) {
    const unique_fd manager(socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    const sockaddr_un address = {AF_UNIX, "notify"};
    ASSERT_EQ(bind(manager.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    setenv("NOTIFY_SOCKET", (directory + "/notify").c_str(), 1);
    daemon_process daemon = launch({{"-C"}});
    EXPECT_EQ(receive_text(manager.get()), "READY=1");
    EXPECT_TRUE(connect_client(socket_kind::stream).ok());
    daemon.send_signal(SIGTERM);
    EXPECT_EQ(receive_text(manager.get()), "STOPPING=1");
    EXPECT_EQ(daemon.wait_exit(), 0);
}

}  // namespace
}  // namespace kivd
