// Stops and starts at any moment, one after the other and one beside the other.
#include <fcntl.h>
#include <sys/ioctl.h>
#include <sys/prctl.h>
#include <sys/stat.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <csignal>
#include <random>
#include <thread>

#include "end_to_end/daemon_test.h"
#include "settings.pb.h"
#include "support/config_package.h"
#include "util/clock.h"
#include "util/paths.h"

namespace kivd {
namespace {

using namespace std::string_literals;

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr int slowness = 3;
#else
constexpr int slowness = 1;
#endif
constexpr int stop_limit_ms = 5000;  // a second when the machine has nothing else to do

int64_t now_us() {
    const auto now = std::chrono::steady_clock::now().time_since_epoch();
    return std::chrono::duration_cast<std::chrono::microseconds>(now).count();
}

std::string letters(size_t size) {
    std::minstd_rand random(1);
    std::string text(size, '\0');
    std::ranges::generate(text, [&random] { return static_cast<char>('a' + random() % 26); });
    return text;
}

// Collects diagnostics, and looks different each time.
std::string configuration(int number) {
    const auto on = own_part<RunActions>("RunActions", "activate_lumora_diagnostics: true");
    return config_file({on, {"p", "number", std::to_string(number)}});
}

// Clients of all kinds, until they are told to stop or the daemon is gone.
class load {
 public:
    explicit load(const std::string& run) {
        for (const std::string& name : {run + ".a", run + ".b"}) {
            int& count = acknowledged_[name];
            threads_.emplace_back([this, name, &count] { produce(name, count); });
        }
        threads_.emplace_back([this, run] { produce_datagrams(run + ".c"); });
        threads_.emplace_back([this] { operate(); });
    }
    // How many events of which name have arrived for certain.
    std::map<std::string, int> finish() {
        stop_ = true;
        threads_.clear();
        return acknowledged_;
    }

 private:
    static std::string event(const std::string& name, int number) {
        static const std::string filler = letters(2000);
        const auto size = static_cast<size_t>(number) * 7 % 1000;
        return "EV p " + name + " " + std::to_string(number) + " " + filler.substr(size, size);
    }
    void produce(const std::string& name, int& acknowledged) const {
        const unique_fd client = connect_client(socket_kind::packets);
        for (int i = 0; !stop_; ++i) {
            if (!send_text(client.get(), event(name, i))) return;
            if (!send_text(client.get(), "CI p counter 1")) return;
            if (i % 10 != 9) continue;
            if (ask(client.get(), "IA") != "1") return;
            acknowledged = i + 1;
        }
    }
    void produce_datagrams(const std::string& name) const {
        const unique_fd client = connect_client(socket_kind::datagram);
        for (int i = 0; !stop_ && send_text(client.get(), event(name, i));) ++i;
    }
    void operate() const {
        const std::string diagnosed = "EV devicemonitor.powerstat ShutDown " + letters(30000);
        const unique_fd client = connect_client(socket_kind::packets);
        for (int i = 0; !stop_; ++i) {
            for (const std::string& each : {"FL"s, diagnosed, "FS"s, diagnosed, diagnosed}) {
                if (!send_text(client.get(), each)) return;
            }
            if (!send_text(client.get(), "WC " + configuration(i))) return;
            if (ask(client.get(), "NC") != "1") return;
            for (int j = 0; j < 50; ++j) (void)ask(client.get(), "IA");  // time for the others
        }
    }

    std::atomic<bool> stop_ = false;
    std::map<std::string, int> acknowledged_;
    std::vector<std::jthread> threads_;
};

class stop_and_start : public daemon_test {
 protected:
    stop_and_start() {
        EXPECT_EQ(prctl(PR_SET_CHILD_SUBREAPER, 1), 0);
        std::filesystem::create_directory("input");
        write_file("input/config", configuration(0));
        const int64_t begin = now_us();
        daemon_process daemon = start();
        start_us_ = now_us() - begin;
        EXPECT_EQ(daemon.stop(), 0);
    }
    void wait_up_to(int64_t us) {
        std::this_thread::sleep_for(
            std::chrono::microseconds(random_() % static_cast<uint64_t>(us)));
    }
    // A daemon whose starter ends when it has detached.
    static daemon_process behind(daemon_process starter) {
        EXPECT_EQ(starter.wait_exit(), 0);
        EXPECT_TRUE(wait_until([] { return connect_client(socket_kind::stream).ok(); }));
        return daemon_process(std::stoi(read_file(paths::lock_file)));
    }
    static void expect_no_left_overs() {
        for (const char* folder : {".", "private"}) {
            for (const auto& entry : std::filesystem::directory_iterator(folder)) {
                for (const char* part :
                     {".pid", "kiv_c", "flushed", "new_config", "txt_", "_tmp", "compressed"}) {
                    EXPECT_EQ(entry.path().filename().string().find(part), std::string::npos)
                        << entry;
                }
            }
        }
    }
    // Takes the reports away. The events of each name have to be numbered without a gap.
    void take_reports() {
        for (const auto& [number, path] : report_paths()) {
            take(parse(gunzip_file(path)));
            std::filesystem::remove(path);
        }
    }
    void take(const kiv::Report& report) {
        for (const kiv::Event& event : report.events()) {
            if (event.package() != "p") continue;
            EXPECT_EQ(std::stoi(event.payload()), taken_[event.name()]++) << event.name();
        }
        for (const auto& each : report.counters()) {
            if (each.name() == "counter") counter_ = each.value();
        }
    }

    int64_t start_us_ = 0;
    std::minstd_rand random_{1};
    std::map<std::string, int> taken_;  // events of each name
    int64_t counter_ = 0;               // as reported last
};

// Before it starts up, under load, and when it is about to sleep, where a signal gets lost.
TEST_F(stop_and_start, at_any_moment_it_stops_soon_and_loses_nothing) {
    constexpr int rounds = 200 / slowness;
    std::map<std::string, int> acknowledged;
    int64_t slowest_us = 0;
    for (int round = 0; round < rounds && !HasFailure(); ++round) {
        SCOPED_TRACE(round);
        daemon_process daemon = launch({{"-C"}});
        std::optional<load> clients;
        if (round % 4 == 0) {
            wait_up_to(start_us_ * 3 / 2);
        } else {
            ASSERT_TRUE(daemon.wait_ready());
            clients.emplace(std::to_string(round));
            wait_up_to(int64_t{60000} * slowness);
            if (round % 4 == 1) {
                acknowledged.merge(clients->finish());
                wait_up_to(2000);
            }
        }
        const int64_t begin = now_us();
        daemon.send_signal(SIGTERM);
        if (round % 3 == 0) daemon.send_signal(SIGTERM);
        const int status = daemon.wait_exit(stop_limit_ms);
        // In its first moments a signal is the system's business, and nothing has been done yet.
        EXPECT_TRUE(status == 0 || (status == 128 + SIGTERM && daemon.log().empty()))
            << status << daemon.log();
        slowest_us = std::max(slowest_us, now_us() - begin);
        EXPECT_EQ(errors(daemon), 0U) << daemon.log();
        if (clients) acknowledged.merge(clients->finish());
        expect_no_left_overs();
        take_reports();
    }
    daemon_process daemon = start();
    request({"EV p last 0", "FL"});
    EXPECT_EQ(daemon.stop(), 0);
    take_reports();
    int counted = 0;  // by the connections, one for each event
    for (const auto& [name, count] : acknowledged) {
        EXPECT_GE(taken_[name], count) << name;
        counted += taken_[name];
    }
    EXPECT_LE(counter_, counted);
    EXPECT_GE(counter_, counted - 2 * rounds);
    EXPECT_EQ(taken_["last"], 1);
    printf("the slowest of %d stops took %ld ms; %d events\n", rounds, slowest_us / 1000, counted);
}

TEST_F(stop_and_start, a_second_instance_leaves_the_first_alone_or_follows_it) {
    int followed = 0;
    for (int round = 0; round < 45 / slowness && !HasFailure(); ++round) {
        SCOPED_TRACE(round);
        daemon_process first = launch({{"-C"}});
        std::optional<load> clients;
        const bool is_stopping = round % 3 == 2;
        if (round % 3 == 0) {
            wait_up_to(start_us_ * 3 / 2);
        } else {
            ASSERT_TRUE(first.wait_ready());
            clients.emplace(std::to_string(round));
            wait_up_to(20000);
        }
        if (is_stopping) {
            first.send_signal(SIGTERM);
            wait_up_to(10000);
        }
        daemon_process second = launch({{"-C"}});
        const bool first_serves = !is_stopping && first.wait_ready();
        const bool second_serves = second.wait_ready();
        EXPECT_TRUE(is_stopping || first_serves != second_serves);
        if (clients) (void)clients->finish();
        if (first_serves || second_serves) {
            request({"EV p event x"});
            EXPECT_EQ(ask(connect_client(socket_kind::stream).get(), "HD 2 IA"), "1");
        }
        followed += is_stopping && second_serves;
        for (daemon_process* each : {&first, &second}) {
            const bool is_refused = each->count_in_log("Another kivd is already running") > 0;
            EXPECT_EQ(each->stop(), is_refused ? 1 : 0) << each->log();
        }
        expect_no_left_overs();
    }
    printf("%d served when the first had gone\n", followed);
}

// Stopped or killed as soon as the flush is through, with the compactor under way.
TEST_F(stop_and_start, no_report_is_lost_between_a_flush_and_the_next_start) {
    constexpr int rounds = 40 / slowness;
    for (int round = 0; round < rounds; ++round) {
        daemon_process daemon = start();
        request({"EV p event " + std::to_string(round) + " " + letters(30000), "FL"});
        daemon.send_signal(round % 2 == 0 ? SIGTERM : SIGKILL);
        EXPECT_EQ(daemon.wait_exit(), round % 2 == 0 ? 0 : 128 + SIGKILL);
    }
    EXPECT_EQ(start().stop(), 0);
    take_reports();
    EXPECT_EQ(taken_["event"], rounds);
}

TEST_F(stop_and_start, lists_are_read_up_to_their_limit) {
    for (const int count : {20000, 20001}) {
        std::string counters;
        std::string values;
        const std::string now = std::to_string(now_ms()) + '\0';
        for (int i = 0; i < count; ++i) {
            const std::string head = "p\0"s + std::to_string(100000 + i) + '\0' + now + now;
            counters += head + std::to_string(i) + "\0\0\n"s;
            values += head + "value " + std::to_string(i) + "\0\0\n"s;
        }
        std::filesystem::create_directory("private");
        write_file(paths::counters, counters);
        write_file(paths::static_data, values);
        const int64_t begin = now_us();
        daemon_process daemon = start();
        printf("with %d counters and values it served after %ld ms\n", count,
               (now_us() - begin) / 1000);
        request({"FL"});
        const kiv::Report report = wait_report(1);
        ASSERT_TRUE(report.counters_size() == 20000 && report.statics_size() == 20000);
        for (int i = 0; i < 20000; ++i) {
            EXPECT_EQ(report.counters(i).value(), i);
            EXPECT_EQ(report.statics(i).value(), "value " + std::to_string(i));
        }
        EXPECT_EQ(daemon.stop(), 0);
        EXPECT_EQ(errors(daemon), 0U) << daemon.log();
        remove_everything_kept();
    }
}

TEST_F(stop_and_start, whatever_it_is_started_from_it_serves_and_stops) {
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
    for (const auto& each : cases) {
        for (const bool is_detached : {false, true}) {
            SCOPED_TRACE(each.name);
            const int64_t begin = now_us();
            daemon_process daemon(
                "/bin/sh", {{"-c", each.preparation + "\nexec \"$0\" \"$@\""s, KIVD_PATH,
                             is_detached ? "-C" : "-CD", "-b", directory, "-c", "NO_ENCRYPTION"}});
            if (is_detached) daemon = behind(std::move(daemon));
            ASSERT_TRUE(wait_until([] { return connect_client(socket_kind::stream).ok(); }));
            printf("%s%s: served after %ld ms\n", each.name, is_detached ? ", detached" : "",
                   (now_us() - begin) / 1000);
            for (const char* fd : {"0", "1", "2"}) {
                EXPECT_TRUE(exists("/proc/" + std::to_string(daemon.pid()) + "/fd/" + fd));
            }
            for (const int signal : {SIGHUP, SIGPIPE, SIGQUIT, SIGUSR1, SIGUSR2, SIGALRM, SIGCHLD,
                                     SIGIO, SIGPROF, SIGVTALRM, SIGXCPU, SIGXFSZ}) {
                daemon.send_signal(signal);
            }
            request(std::vector<std::string>(1500, "XY"));  // more lines than a pipe holds
            request({"EV p event x", "FL"});
            EXPECT_GT(wait_report(1).events_size(), 0);
            std::filesystem::remove("output/kiv_1");
            daemon.send_signal(SIGINT);
            EXPECT_EQ(daemon.wait_exit(), 0) << daemon.log();
            expect_no_left_overs();
        }
    }
}

// The compactor has more to write than its pipe holds.
TEST_F(stop_and_start, a_stop_of_the_whole_process_group_lets_the_compactor_end_its_work) {
    daemon_process daemon = behind({KIVD_PATH, {{"-ZC", "-b", directory, "-c", "NO_ENCRYPTION"}}});
    ASSERT_EQ(mkfifo(paths::compacted_data, 0600), 0);
    const unique_fd pipe(open(paths::compacted_data, O_RDONLY | O_NONBLOCK | O_CLOEXEC));
    for (int i = 0; i < 8; ++i) request({"EV p event " + std::to_string(i) + letters(30000)});
    request({"FL"});
    int size = 0;
    ASSERT_TRUE(wait_until([&] { return ioctl(pipe.get(), FIONREAD, &size) == 0 && size > 0; }));
    EXPECT_EQ(kill(-daemon.pid(), SIGTERM), 0);
    EXPECT_TRUE(daemon.wait_idle());

    std::string report;
    (void)wait_until([&] {
        const bool is_complete = !exists(paths::compacted_data);
        std::array<char, 65536> bytes;
        ssize_t n = 0;
        while ((n = read(pipe.get(), bytes.data(), bytes.size())) > 0) {
            report.append(bytes.data(), static_cast<size_t>(n));
        }
        return is_complete;
    });
    EXPECT_EQ(daemon.wait_exit(), 0);
    write_file("report.gz", report);
    take(parse(gunzip_file("report.gz")));
    EXPECT_EQ(taken_["event"], 8);
    expect_no_left_overs();
}

}  // namespace
}  // namespace kivd
