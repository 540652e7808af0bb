// What hostile clients do, as lists of steps, and what has to hold after each of them: the daemon
// serves the others, and has kept neither descriptors nor memory.
#pragma once

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/wait.h>

#include <chrono>
#include <concepts>
#include <csignal>
#include <cstring>
#include <set>
#include <sstream>
#include <thread>

#include "end_to_end/daemon_test.h"

namespace kivd {

// Sanitizers keep memory that is freed.
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr bool sanitized = true;
#else
constexpr bool sanitized = false;
#endif

// How a client's packets travel; on the stream socket either behind their headers, or as the bytes
// that they are.
enum class way : uint8_t { datagram, packets, framed, bytes };

// One client at its work.
struct attack {
    daemon_process& daemon;
    way via;
    size_t log_start;
    unique_fd client{};  // connected by the first step that needs it, and again after a hang-up
    std::vector<unique_fd> kept{};  // whatever it holds until its end
    bool daemon_held = false;

    int fd() {
        if (!client.ok()) client = connect_client(std::min(socket_kind(via), socket_kind::stream));
        return client.get();
    }
    [[nodiscard]] std::string packet(const std::string& text) const {
        return via == way::framed ? framed(text) : text;
    }
    [[nodiscard]] bool has_logged(const std::string& text) const {
        return daemon.log(log_start).find(text) != std::string::npos;
    }
};

// A text is a step too: a packet, sent when the daemon has taken the one before.
class step {
 public:
    step(std::string text)
        : act_([text = std::move(text)](attack& a) {
              EXPECT_TRUE(a.daemon_held || wait_taken(a.fd()));
              // It may look for more in the same call still.
              if (a.via == way::bytes) std::this_thread::sleep_for(std::chrono::milliseconds(2));
              EXPECT_TRUE(send_text(a.fd(), a.packet(text))) << strerror(errno);
          }) {}
    step(const char* text) : step(std::string(text)) {}
    template <std::invocable<attack&> action>
    step(action act) : act_(std::move(act)) {}
    void operator()(attack& a) const { act_(a); }

 private:
    std::function<void(attack&)> act_;
};
using steps = std::vector<step>;

inline void take(attack& a, const steps& all) {
    for (const step& each : all) each(a);
}

inline step repeat(int count, steps all) {
    return [=](attack& a) {
        for (int i = 0; i < count; ++i) take(a, all);
    };
}

// As fast as it goes.
inline step flood(int count, std::string text) {
    return [=](attack& a) {
        for (int i = 0; i < count; ++i) {
            ASSERT_TRUE(send_text(a.fd(), a.packet(text))) << strerror(errno);
        }
    };
}

inline const step hang_up = [](attack& a) { a.client.reset(); };
inline const step keep = [](attack& a) { a.kept.push_back(std::move(a.client)); };
inline const step release = [](attack& a) { a.kept.clear(); };

// What is sent in between queues up and comes to the daemon at once.
inline const step hold = [](attack& a) {
    a.daemon_held = true;
    a.daemon.send_signal(SIGSTOP);
    siginfo_t stopped;
    EXPECT_EQ(
        waitid(P_PID, static_cast<id_t>(a.daemon.pid()), &stopped, WSTOPPED | WEXITED | WNOWAIT),
        0);
};
inline const step let_go = [](attack& a) {
    a.daemon_held = false;
    a.daemon.send_signal(SIGCONT);
};

// All replies so far, which come one by one or together.
inline step hears(std::string replies) {
    return [=](attack& a) {
        std::string heard;
        for (size_t before = 1; heard.size() < replies.size() && before != heard.size();) {
            before = heard.size();
            heard += receive_text(a.fd());
        }
        EXPECT_EQ(heard, replies);
    };
}

inline step is_logged(std::string text) {
    return [=](attack& a) { EXPECT_TRUE(wait_until([&] { return a.has_logged(text); })) << text; };
}

// On each kind of connection.
inline const step others_are_served = [](attack& a) {
    for (const way via : {way::packets, way::framed}) {
        attack other{a.daemon, via, 0};
        take(other, {"IA", hears("1")});
    }
};

inline const step daemon_is_idle = [](attack& a) { EXPECT_TRUE(a.daemon.wait_idle()); };

inline std::string maybe(const std::string& text) { return "?" + text; }

struct behaviour {
    const char* name;
    std::vector<way> ways;
    steps what;
    // Parts of all warnings and errors that it leads to, with N for a client's number; `maybe` for
    // one that depends on the moment.
    std::vector<std::string> logged = {};
    std::string reply = {};
};

// Lets clients loose on one daemon.
template <class test>
class besieged : public test {
 protected:
    // Each behaviour on each of its ways.
    void withstand(const start_options& options, const std::vector<behaviour>& behaviours) {
        // What it opens at the first use, it keeps.
        daemon_ = this->start(options);
        attack a{daemon_, way::datagram, 0};
        take(a, {hold, repeat(10, {std::string(31176, 'X'), hang_up}), let_go});
        expect_service();
        descriptors_ = daemon_.descriptors();
        anonymous_kib_ = daemon_.anonymous_kib();
        for (const behaviour& each : behaviours) {
            for (const way via : each.ways) {
                withstand(each, via);
                if (testing::Test::HasFailure()) return;  // what follows would only wait
            }
        }
        EXPECT_EQ(daemon_.stop(), 0) << daemon_.log();
        EXPECT_GT(everything_kept().events_size(), 0);
    }

 private:
    void withstand(const behaviour& each, way via) {
        SCOPED_TRACE(testing::Message() << each.name << ", way " << static_cast<int>(via));
        attack a{daemon_, via, daemon_.log().size()};
        take(a, each.what);
        if (a.client.ok() && via != way::datagram) {
            take(a, {hears(each.reply), via == way::bytes ? "HD 2 IA" : "IA", hears("1")});
        }
        a.client.reset();
        expect_service();
        EXPECT_TRUE(wait_until([this] { return daemon_.descriptors() == descriptors_; }))
            << daemon_.descriptors() << " descriptors instead of " << descriptors_;
        EXPECT_TRUE(sanitized || daemon_.anonymous_kib() < anonymous_kib_ + 1024);
        expect_logged(each.logged, a.log_start);
    }

    // On every socket. False too if a report was due just then, and took the event along.
    bool takes_event() {
        const std::string mark = "alive " + std::to_string(++marks_) + ";";
        EXPECT_TRUE(send_text(connect_client(socket_kind::datagram).get(), "EV p alive " + mark));
        const auto is_kept = [&] {
            return read_file("private/events").find(mark) != std::string::npos;
        };
        return wait_until(is_kept, promised.count());
    }

    void expect_service() {
        const auto start = std::chrono::steady_clock::now();
        attack other{daemon_, way::packets, 0};
        others_are_served(other);
        EXPECT_LE(std::chrono::steady_clock::now() - start, promised);
        EXPECT_TRUE(takes_event() || takes_event());
    }

    // These and nothing else, but for the end of a flood of errors.
    void expect_logged(const std::vector<std::string>& texts, size_t start) {
        std::set<std::string> logged;
        std::istringstream log(daemon_.log(start));
        std::string date, time, pid, tid, level, text;
        while (log >> date >> time >> pid >> tid >> level && std::getline(log, text)) {
            if (level == "I" || text.ends_with(" to prevent flooding.")) continue;
            if (const size_t client = text.find("lient "); client != std::string::npos) {
                const size_t number = client + strlen("lient ");
                text.replace(number, text.find_first_not_of("0123456789", number) - number, "N");
            }
            logged.insert(level + text);
        }
        for (const std::string& each : texts) {
            const bool optional = each.starts_with("?");
            const auto is_this = [part = each.substr(optional ? 1 : 0)](const std::string& line) {
                return line.find(part) != std::string::npos;
            };
            EXPECT_TRUE(std::erase_if(logged, is_this) > 0 || optional) << "not logged: " << each;
        }
        for (const std::string& line : logged) ADD_FAILURE() << "logged: " << line.substr(0, 200);
    }

    // No timing: a bound of the system's, wide enough for any machine.
    static constexpr std::chrono::milliseconds promised{1000};

    daemon_process daemon_;
    size_t descriptors_ = 0;
    int64_t anonymous_kib_ = 0;
    int marks_ = 0;
};

}  // namespace kivd
