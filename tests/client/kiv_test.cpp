#include "kiv.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/wait.h>

#include <array>
#include <atomic>
#include <chrono>
#include <fstream>
#include <map>
#include <memory>
#include <semaphore>
#include <set>
#include <utility>

#include "fake_daemon.h"
#include "support/scratch_directory.h"

namespace kivd {
namespace {

struct handle_closer {
    void operator()(kiv_handle* handle) const { kiv_destroy(handle); }
};
using unique_handle = std::unique_ptr<kiv_handle, handle_closer>;

struct libkiv : testing::Test {
    void restart() {
        producer_socket.reset();
        producer_socket = std::make_unique<bound_socket>(SOCK_DGRAM, directory.path + "/kiv_cl");
    }

    // Sends until the daemon's queue is full; gives how many it holds.
    int fill_queue() {
        int count = 0;
        while (kiv_inc_counter(handle.get(), "fill", "queue", count) == 0) ++count;
        return count;
    }

    socket_directory directory;
    std::unique_ptr<bound_socket> producer_socket =
        std::make_unique<bound_socket>(SOCK_DGRAM, directory.path + "/kiv_cl");
    unique_handle handle{kiv_create_from_path(directory.path.c_str())};
};

// The next message of a sender that names itself and counts: "EV PACKAGE n COUNT".
std::pair<std::string, int> parse_counted(const std::string& message) {
    char package[32] = {};
    int count = -1;
    EXPECT_EQ(sscanf(message.c_str(), "EV %31s n %d", package, &count), 2) << message;
    return {package, count};
}

int send_counted(kiv_handle* handle, const std::string& package, int count) {
    const std::string payload = std::to_string(count);
    return kiv_add_event(handle, package.c_str(), "n", payload.data(), payload.size());
}

TEST_F(libkiv, producing_calls_send_these_bytes_or_refuse) {
    const std::string package(200, 'p'), name(56, 'n'), id = package + " " + name + " ";
    const std::string payload("\0\n x", 4), largest(30'720, 'x');
    const std::string longest_value(31'176 - 3 - id.size(), 'v');
    kiv_handle* h = handle.get();

    const auto event = [h](const std::string& p, const std::string& n, const std::string& bytes) {
        return kiv_add_event(h, p.c_str(), n.c_str(), bytes.data(), bytes.size());
    };
    const auto fixed = [h](const std::string& p, const std::string& n, const std::string& value) {
        return kiv_set_static_data(h, p.c_str(), n.c_str(), value.c_str());
    };
    const struct {
        std::function<int()> call;
        int result;
        std::string sent;
    } cases[] = {
        {[&] { return event("p", "n", ""); }, 0, "EV p n "},
        {[&] { return kiv_add_event(h, "p", "n", nullptr, 0); }, 0, "EV p n "},
        {[&] { return event("p", "n", payload); }, 0, "EV p n " + payload},
        {[&] { return event(package, name, largest); }, 0, "EV " + id + largest},
        {[&] { return event("p", "n", largest + "x"); }, -EMSGSIZE, ""},
        {[&] { return event(package, name + "n", ""); }, -EMSGSIZE, ""},
        {[&] { return kiv_add_event(h, "p", "n", nullptr, 1); }, -EINVAL, ""},

        {[&] { return kiv_set_counter(h, "p", "n", 0); }, 0, "CS p n 0"},
        {[&] { return kiv_set_counter(h, "p", "n", INT32_MAX); }, 0, "CS p n 2147483647"},
        {[&] { return kiv_inc_counter(h, "p", "n", INT32_MIN); }, 0, "CI p n -2147483648"},
        {[&] { return kiv_set_counter(h, "p", "n", INT32_MAX + 1LL); }, -ERANGE, ""},
        {[&] { return kiv_inc_counter(h, "p", "n", INT32_MIN - 1LL); }, -ERANGE, ""},
        {[&] { return kiv_inc_counter(h, nullptr, "n", 1); }, -EINVAL, ""},
        {[&] { return kiv_set_counter(h, "p", nullptr, 1); }, -EINVAL, ""},

        {[&] { return fixed("p", "n", " a\tb\n"); }, 0, "SD p n  a\tb\n"},
        {[&] { return fixed(package, name, longest_value); }, 0, "SD " + id + longest_value},
        {[&] { return fixed(package, name, longest_value + "v"); }, -EMSGSIZE, ""},
        {[&] { return fixed("p", "n", ""); }, -EINVAL, ""},
        {[&] { return kiv_set_static_data(h, "p", "n", nullptr); }, -EINVAL, ""},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(&c - cases);
        EXPECT_EQ(c.call(), c.result);
        EXPECT_EQ(producer_socket->receive_now().value_or(""), c.sent);
    }

    for (const char* bad : {"", " ", "a b", "a ", "\ta", "a\rb", "a\n"}) {
        SCOPED_TRACE(bad);
        EXPECT_EQ(event(bad, "n", "x"), -EINVAL);
        EXPECT_EQ(event("p", bad, "x"), -EINVAL);
        EXPECT_EQ(kiv_set_counter(h, bad, "n", 1), -EINVAL);
        EXPECT_EQ(fixed("p", bad, "x"), -EINVAL);
        EXPECT_FALSE(producer_socket->receive_now());
    }
    EXPECT_EQ(kiv_dropped(h), 0u);
}

TEST_F(libkiv, finds_the_daemon_or_says_why_not) {
    // a directory whose sockets have the longest path that an address holds
    const size_t left = 107 - std::string("/kiv_cl").size() - directory.path.size() - 1;
    const std::string deep = directory.path + "/" + std::string(left, 'd');
    std::filesystem::create_directory(deep);
    const bound_socket deep_socket(SOCK_DGRAM, deep + "/kiv_cl");
    const std::string stale = directory.path + "/stale";
    std::filesystem::create_directory(stale);
    { const bound_socket closed(SOCK_DGRAM, stale + "/kiv_cl"); }

    const struct {
        std::string path;
        int error;
    } cases[] = {
        {directory.path, 0},
        {directory.path + "/", 0},
        {deep, 0},
        {deep + "/", 0},
        {deep + "d", ENAMETOOLONG},
        {std::string(5000, 'd'), ENAMETOOLONG},
        {directory.path + "/none", ENOENT},
        {stale, ECONNREFUSED},
        {"", EINVAL},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.path);
        const unique_handle made(kiv_create_from_path(c.path.c_str()));
        const int error = made ? 0 : errno;
        EXPECT_EQ(error, c.error);
    }
    EXPECT_EQ(kiv_create_from_path(nullptr), nullptr);
    kiv_destroy(nullptr);
}

TEST_F(libkiv, a_full_queue_drops_and_counts_and_takes_again_once_there_is_room) {
    const int queued = fill_queue();
    EXPECT_GT(queued, 0);
    EXPECT_EQ(kiv_dropped(handle.get()), 1u);
    EXPECT_EQ(send_counted(handle.get(), "late", 0), -EAGAIN);
    EXPECT_EQ(kiv_dropped(handle.get()), 2u);

    kiv_set_wait(handle.get(), 50);
    const auto start = std::chrono::steady_clock::now();
    EXPECT_EQ(send_counted(handle.get(), "late", 1), -EAGAIN);
    EXPECT_GE(std::chrono::steady_clock::now() - start, std::chrono::milliseconds(50));
    EXPECT_EQ(kiv_dropped(handle.get()), 3u);
    kiv_set_wait(handle.get(), 0);

    for (int i = 0; i < queued; ++i) {
        EXPECT_EQ(producer_socket->receive_now(), "CI fill queue " + std::to_string(i));
    }
    EXPECT_EQ(send_counted(handle.get(), "late", 2), 0);
    EXPECT_EQ(producer_socket->receive_now(), "EV late n 2");
}

TEST_F(libkiv, eight_threads_that_wait_for_room_lose_nothing_and_keep_their_order) {
    constexpr int thread_count = 8, events_each = 500;
    kiv_set_wait(handle.get(), 20'000);
    std::array<std::jthread, thread_count> threads;
    for (int i = 0; i < thread_count; ++i) {
        threads[static_cast<size_t>(i)] = std::jthread([this, package = "p" + std::to_string(i)] {
            for (int count = 0; count < events_each; ++count) {
                EXPECT_EQ(send_counted(handle.get(), package, count), 0);
            }
        });
    }
    std::map<std::string, int> next;
    for (int i = 0; i < thread_count * events_each; ++i) {
        const auto message = producer_socket->receive();
        ASSERT_TRUE(message) << i;
        const auto [package, count] = parse_counted(*message);
        EXPECT_EQ(count, next[package]++);
    }
    EXPECT_EQ(next.size(), size_t{thread_count});
    EXPECT_EQ(kiv_dropped(handle.get()), 0u);
}

TEST_F(libkiv, outlives_a_restart_of_the_daemon) {
    EXPECT_EQ(send_counted(handle.get(), "p", 1), 0);
    restart();  // unseen by the handle
    EXPECT_EQ(send_counted(handle.get(), "p", 2), 0);
    EXPECT_EQ(producer_socket->receive_now(), "EV p n 2");

    producer_socket.reset();
    EXPECT_EQ(send_counted(handle.get(), "p", 3), -ECONNREFUSED);
    EXPECT_EQ(send_counted(handle.get(), "p", 4), -ECONNREFUSED);
    std::filesystem::remove(directory.path + "/kiv_cl");
    EXPECT_EQ(send_counted(handle.get(), "p", 5), -ENOENT);
    restart();
    EXPECT_EQ(send_counted(handle.get(), "p", 6), 0);
    EXPECT_EQ(producer_socket->receive_now(), "EV p n 6");
}

// Threads that send counted events on one handle until they are stopped.
class senders {
 public:
    senders(kiv_handle* handle, int count) {
        for (int i = 0; i < count; ++i) {
            threads_.emplace_back([this, handle, package = "p" + std::to_string(i)] {
                for (int sent = 0; !stop_; ++sent) {
                    const int result = send_counted(handle, package, sent);
                    EXPECT_TRUE(result == 0 || result == -ECONNREFUSED || result == -ENOENT);
                }
            });
        }
    }
    ~senders() { stop_ = true; }

 private:
    std::atomic<bool> stop_ = false;
    std::vector<std::jthread> threads_;
};

TEST_F(libkiv, both_sides_of_a_fork_go_on_whatever_other_threads_do) {
    constexpr int child_count = 20;
    kiv_set_wait(handle.get(), 20'000);
    const senders two(handle.get(), 2);
    std::vector<pid_t> children;
    for (int i = 0; i < child_count; ++i) {
        const pid_t child = fork();
        if (child == 0) {
            alarm(30);  // a deadlock ends by a signal
            _exit(send_counted(handle.get(), "child", i) == 0 ? 0 : 1);
        }
        children.push_back(child);
    }
    std::set<int> heard;
    while (heard.size() < child_count) {
        const auto message = producer_socket->receive();
        ASSERT_TRUE(message) << heard.size();
        const auto [package, count] = parse_counted(*message);
        if (package == "child") heard.insert(count);
    }
    for (const pid_t child : children) {
        int status = -1;
        EXPECT_EQ(waitpid(child, &status, 0), child);
        EXPECT_EQ(status, 0);
    }
    producer_socket.reset();
}

// Every control call with what the daemon gets to see of it.
struct control_call {
    std::function<int(kiv_handle*)> call;
    std::vector<std::string> requests;
    bool is_privileged;
    int result = 0;
};
const control_call control_calls[] = {
    {kiv_is_alive, {"IA"}, false},
    {[](kiv_handle* h) { return kiv_set_group_id(h, "new"); }, {"SG new", "IA"}, false},
    {[](kiv_handle* h) { return kiv_delete_group_id(h, "old"); }, {"DG old", "IA"}, false},
    {[](kiv_handle* h) { return kiv_replace_group_id(h, "new", "old"); },
     {"RG new old", "IA"},
     false},
    {kiv_flush, {"GD", "FL", "IA"}, true},
    {kiv_save, {"GD", "FS", "IA"}, true},
    {[](kiv_handle* h) { return kiv_set_data_collection(h, 0); }, {"GD", "DC 0", "IA"}, true},
    {[](kiv_handle* h) { return kiv_set_data_collection(h, -7); }, {"GD", "DC 1", "IA"}, true},
    {[](kiv_handle* h) { return kiv_remove_reports(h, 0); }, {"GD", "RM 0", "IA"}, true},
    {[](kiv_handle* h) { return kiv_remove_reports(h, INT32_MAX); },
     {"GD", "RM 2147483647", "IA"},
     true},
    {[](kiv_handle* h) {
         char device_id[KIV_DEVICE_ID_MAX + 1];
         return kiv_get_device_id(h, device_id);
     },
     {"GD", "IA"},
     true},
    {[](kiv_handle* h) { return kiv_is_probe_active(h, "p", "wanted"); },
     {"PA p wanted"},
     false,
     1},
    {[](kiv_handle* h) { return kiv_is_probe_active(h, "p", "n"); }, {"PA p n"}, false, 0},
    {[](kiv_handle* h) { return kiv_get_config(h, "p", "n"); }, {"GC p n"}, false, -ENOENT},
    {[](kiv_handle* h) { return kiv_next_file(h, 4); }, {"GD", "FN 750 0000000004"}, true, 5},
    {[](kiv_handle* h) { return kiv_next_file(h, INT32_MAX); },
     {"GD", "FN 750 2147483647"},
     true,
     -ENOENT},
    {[](kiv_handle* h) { return kiv_get_file(h, 7); }, {"GD", "FG 750 7"}, true, -ENOENT},
    {kiv_announce_config, {"GD", "NC"}, true, 1},
    {[](kiv_handle* h) { return kiv_install_config(h, " \0\n", 3); },
     {"GD", std::string("WC  \0\n", 6), "NC"},
     true,
     1},
};

TEST_F(libkiv, control_requests_are_handled_when_the_call_returns_and_refusals_are_noticed) {
    // ids that look like answers, and none for a refused caller
    for (const std::string device_id : {"1", "0", "-1", "FAIL", ""}) {
        const bool is_allowed = !device_id.empty();
        control_server server(directory.path, is_allowed ? allowing(device_id) : refusing());
        for (const auto& c : control_calls) {
            SCOPED_TRACE(c.requests[c.requests.size() / 2] + (is_allowed ? "" : " refused"));
            EXPECT_EQ(c.call(handle.get()), c.is_privileged && !is_allowed ? -EPERM : c.result);
            EXPECT_EQ(server.take_requests(), c.requests);
        }
    }
    // not sent, so that no daemon is needed
    const std::string longest(31'173, 'g');
    for (auto* call : {kiv_remove_reports, kiv_next_file, kiv_get_file}) {
        EXPECT_EQ(call(handle.get(), -1), -EINVAL);
    }
    for (const char* bad : {"", "a b", "a\n", static_cast<const char*>(nullptr)}) {
        EXPECT_EQ(kiv_set_group_id(handle.get(), bad), -EINVAL);
        EXPECT_EQ(kiv_delete_group_id(handle.get(), bad), -EINVAL);
        EXPECT_EQ(kiv_replace_group_id(handle.get(), bad, "id"), -EINVAL);
        EXPECT_EQ(kiv_replace_group_id(handle.get(), "id", bad), -EINVAL);
        EXPECT_EQ(kiv_is_probe_active(handle.get(), bad, "n"), -EINVAL);
        EXPECT_EQ(kiv_get_config(handle.get(), "p", bad), -EINVAL);
    }
    EXPECT_EQ(kiv_is_probe_active(handle.get(), longest.c_str(), "n"), -EMSGSIZE);
    EXPECT_EQ(kiv_get_config(handle.get(), longest.c_str(), "n"), -EMSGSIZE);
    EXPECT_EQ(kiv_install_config(handle.get(), "", 0), -EINVAL);
    EXPECT_EQ(kiv_install_config(handle.get(), nullptr, 1), -EINVAL);
    EXPECT_EQ(kiv_install_config(handle.get(), longest.data(), 31'174), -EMSGSIZE);

    control_server server(directory.path, allowing("0", "0"));
    EXPECT_EQ(kiv_install_config(handle.get(), longest.data(), 31'173), 0);  // not taken
    EXPECT_EQ(server.take_requests()[1], "WC " + longest);
    EXPECT_EQ(kiv_announce_config(handle.get()), 0);
    (void)server.take_requests();
    EXPECT_EQ(kiv_install_config(handle.get(), "\x12\1", 3), 0);
    EXPECT_EQ(server.take_requests()[1],
              doc_example("requests.md", "hex", "write-configuration-request"));
    EXPECT_EQ(kiv_get_config(handle.get(), "app", "Settings"), -ENOENT);
    EXPECT_EQ(server.take_requests()[0],
              doc_example("requests.md", "hex", "get-configuration-request"));
    EXPECT_EQ(kiv_next_file(handle.get(), 0), 5);
    EXPECT_EQ(server.take_requests()[1], doc_example("requests.md", "hex", "next-file-request"));
    EXPECT_EQ(kiv_set_group_id(handle.get(), longest.c_str()), 0);
    EXPECT_EQ(kiv_set_group_id(handle.get(), (longest + "g").c_str()), -EMSGSIZE);
}

TEST_F(libkiv, an_answer_that_is_wrong_or_missing_is_no_success) {
    using answer = std::optional<std::string>;
    const struct {
        answer to_gd, to_ia;
        int alive, flushed;
    } cases[] = {
        {"id", "0", -EPROTO, -EPROTO},
        {"id", "11", -EPROTO, -EPROTO},
        {std::string(KIV_DEVICE_ID_MAX + 1, 'i'), "1", 0, -EPROTO},
        {"id", std::nullopt, -ECONNRESET, -ECONNRESET},
        {std::nullopt, "1", 0, -ECONNRESET},
        {"", std::nullopt, -ECONNRESET, -ECONNRESET},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(&c - cases);
        const control_server server(directory.path, [&c](const std::string& request) -> answer {
            if (request == "GD") return c.to_gd;
            return request == "IA" ? c.to_ia : "";
        });
        EXPECT_EQ(kiv_is_alive(handle.get()), c.alive);
        EXPECT_EQ(kiv_flush(handle.get()), c.flushed);
    }
    const struct {
        answer to_all_but_gd;
        int result;
    } questions[] = {
        {"2", -EPROTO},
        {"10", -EPROTO},
        {"OK", -EPROTO},
        {"-2", -EPROTO},
        {"5x", -EPROTO},
        {"2147483648", -EPROTO},
        {"0" + std::string(KIV_DEVICE_ID_MAX, ' '), -EPROTO},
        {std::nullopt, -ECONNRESET},  // hangs up on WC already
    };
    for (const auto& q : questions) {
        SCOPED_TRACE(&q - questions);
        const control_server server(directory.path, [&q](const std::string& request) -> answer {
            if (request == "GD") return "id";
            return request.starts_with("WC") && q.to_all_but_gd ? "" : q.to_all_but_gd;
        });
        EXPECT_EQ(kiv_is_probe_active(handle.get(), "p", "n"), q.result);
        EXPECT_EQ(kiv_get_config(handle.get(), "p", "n"), q.result);
        EXPECT_EQ(kiv_install_config(handle.get(), "x", 1), q.result);
        EXPECT_EQ(kiv_next_file(handle.get(), 10), q.result);  // going on with "10" has no end
        EXPECT_EQ(kiv_get_file(handle.get(), 10), q.result);
    }
    std::filesystem::remove(directory.path + "/kiv_co");
    EXPECT_EQ(kiv_get_config(handle.get(), "p", "n"), -ECONNREFUSED);  // not: no such part
    EXPECT_EQ(kiv_next_file(handle.get(), 0), -ECONNREFUSED);
    EXPECT_EQ(kiv_get_file(handle.get(), 1), -ECONNREFUSED);
    EXPECT_EQ(kiv_is_alive(handle.get()), -ENOENT);
    { const bound_socket closed(SOCK_SEQPACKET, directory.path + "/kiv_co"); }
    EXPECT_EQ(kiv_flush(handle.get()), -ECONNREFUSED);
}

// How many descriptors of this process stand for the file.
int count_open(const std::string& path) {
    int count = 0;
    for (const auto& entry : std::filesystem::directory_iterator("/proc/self/fd")) {
        std::error_code gone;
        if (std::filesystem::read_symlink(entry.path(), gone) == path) ++count;
    }
    return count;
}

TEST_F(libkiv, a_part_or_file_comes_as_one_descriptor_and_all_others_are_closed) {
    const std::string path = directory.path + "/part";
    std::ofstream(path) << "content";
    const int part = open(path.c_str(), O_RDONLY | O_CLOEXEC);
    const struct {
        control_answer answer;
        int result;  // 0 for a descriptor
    } cases[] = {
        {{"OK", {part}}, 0},
        {{"OK", {part, part}}, -EPROTO},
        {{"OK", {part, part, part, part, part}}, -EPROTO},
        {{"O", {part}}, -EPROTO},
        {{"OKAY", {part}}, -EPROTO},
        {{std::string(KIV_DEVICE_ID_MAX + 1, 'O'), {part}}, -EPROTO},
        {{"FAIL", {part}}, -ENOENT},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(&c - cases);
        const control_server server(directory.path, [&c](const std::string& request) {
            return std::optional(request == "GD" ? "id" : c.answer);
        });
        for (const bool is_file : {false, true}) {
            const int fd =
                is_file ? kiv_get_file(handle.get(), 1) : kiv_get_config(handle.get(), "p", "n");
            EXPECT_EQ(std::min(fd, 0), c.result);
            if (fd >= 0) {
                char content[16];
                EXPECT_EQ(pread(fd, content, sizeof content, 0), 7);
                EXPECT_EQ(fcntl(fd, F_GETFD), FD_CLOEXEC);
                close(fd);
            }
            EXPECT_EQ(count_open(path), 1);
        }

        EXPECT_EQ(kiv_is_probe_active(handle.get(), "p", "n"), -EPROTO);
        EXPECT_EQ(count_open(path), 1);
    }
    close(part);
}

TEST_F(libkiv, says_when_the_process_has_no_room_for_a_part) {
    const int part = open("/dev/null", O_RDONLY | O_CLOEXEC);
    rlimit limit;
    getrlimit(RLIMIT_NOFILE, &limit);
    const control_server server(directory.path, [part, limit](const std::string&) {
        const int lowest_free = dup(part);
        close(lowest_free);
        const rlimit full = {static_cast<rlim_t>(lowest_free), limit.rlim_max};
        setrlimit(RLIMIT_NOFILE, &full);  // of the caller as well
        return std::optional(control_answer("OK", {part}));
    });
    EXPECT_EQ(kiv_get_config(handle.get(), "p", "n"), -EMFILE);
    setrlimit(RLIMIT_NOFILE, &limit);
    close(part);
}

TEST_F(libkiv, a_silent_daemon_is_given_up_at_the_deadline) {
    using std::chrono::milliseconds, std::chrono::steady_clock;
    kiv_set_timeout(handle.get(), 60);
    const auto expect_timeout = [this](int (*call)(kiv_handle*)) {
        const auto start = steady_clock::now();
        EXPECT_EQ(call(handle.get()), -ETIMEDOUT);
        const auto taken = steady_clock::now() - start;
        EXPECT_GE(taken, milliseconds(59));
        EXPECT_LT(taken, milliseconds(1500));
    };
    {
        SCOPED_TRACE("answers the device id and then hangs");
        std::binary_semaphore end(0);
        const control_server server(directory.path, [&end](const std::string& request) {
            if (request == "IA" || request == "NC") end.acquire();
            return std::optional<std::string>(request == "GD" ? "id" : "");
        });
        for (auto* call : {kiv_flush, kiv_announce_config}) {
            expect_timeout(call);
            end.release();
        }
    }
    const bound_socket control_socket(SOCK_SEQPACKET, directory.path + "/kiv_co");
    listen(control_socket.fd(), 0);
    {
        SCOPED_TRACE("accepts nobody");
        expect_timeout(kiv_flush);
    }
    {
        SCOPED_TRACE("has no room for another caller");  // the one before is still in the backlog
        expect_timeout(kiv_is_alive);
    }
}

}  // namespace
}  // namespace kivd
