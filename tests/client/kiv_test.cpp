#include "kiv.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/wait.h>

#include <chrono>
#include <fstream>
#include <map>
#include <memory>
#include <semaphore>
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
    using outcome = std::pair<int, std::string>;  // the result, and what was sent
    const outcome invalid(-EINVAL, ""), too_long(-EMSGSIZE, ""), out_of_range(-ERANGE, "");
    kiv_handle* h = handle.get();
    const auto of = [this](int result) {
        return outcome(result, producer_socket->receive_now().value_or(""));
    };
    const auto event = [&](const std::string& p, const std::string& n, const std::string& bytes) {
        return of(kiv_add_event(h, p.c_str(), n.c_str(), bytes.data(), bytes.size()));
    };
    const auto fixed = [&](const std::string& p, const std::string& n, const std::string& value) {
        return of(kiv_set_static_data(h, p.c_str(), n.c_str(), value.c_str()));
    };
    const std::string package(200, 'p'), name(56, 'n'), id = package + " " + name + " ";
    const std::string payload("\0\n x", 4), largest(30'720, 'x');
    EXPECT_EQ(event("p", "n", ""), outcome(0, "EV p n "));
    EXPECT_EQ(of(kiv_add_event(h, "p", "n", nullptr, 0)), outcome(0, "EV p n "));
    EXPECT_EQ(event("p", "n", payload), outcome(0, "EV p n " + payload));
    EXPECT_EQ(event(package, name, largest), outcome(0, "EV " + id + largest));
    EXPECT_EQ(event("p", "n", largest + "x"), too_long);
    EXPECT_EQ(event(package, name + "n", ""), too_long);
    EXPECT_EQ(of(kiv_add_event(h, "p", "n", nullptr, 1)), invalid);

    EXPECT_EQ(of(kiv_set_counter(h, "p", "n", 0)), outcome(0, "CS p n 0"));
    EXPECT_EQ(of(kiv_set_counter(h, "p", "n", INT32_MAX)), outcome(0, "CS p n 2147483647"));
    EXPECT_EQ(of(kiv_inc_counter(h, "p", "n", INT32_MIN)), outcome(0, "CI p n -2147483648"));
    EXPECT_EQ(of(kiv_set_counter(h, "p", "n", INT32_MAX + 1LL)), out_of_range);
    EXPECT_EQ(of(kiv_inc_counter(h, "p", "n", INT32_MIN - 1LL)), out_of_range);
    EXPECT_EQ(of(kiv_inc_counter(h, nullptr, "n", 1)), invalid);
    EXPECT_EQ(of(kiv_set_counter(h, "p", nullptr, 1)), invalid);

    const std::string longest_value(31'176 - 3 - id.size(), 'v');
    EXPECT_EQ(fixed("p", "n", " a\tb\n"), outcome(0, "SD p n  a\tb\n"));
    EXPECT_EQ(fixed(package, name, longest_value), outcome(0, "SD " + id + longest_value));
    EXPECT_EQ(fixed(package, name, longest_value + "v"), too_long);
    EXPECT_EQ(fixed("p", "n", ""), invalid);
    EXPECT_EQ(of(kiv_set_static_data(h, "p", "n", nullptr)), invalid);

    for (const char* bad : {"", " ", "a b", "a ", "\ta", "a\rb", "a\n"}) {
        SCOPED_TRACE(bad);
        EXPECT_EQ(event(bad, "n", "x"), invalid);
        EXPECT_EQ(event("p", bad, "x"), invalid);
        EXPECT_EQ(of(kiv_set_counter(h, bad, "n", 1)), invalid);
        EXPECT_EQ(fixed("p", bad, "x"), invalid);
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

    const std::pair<std::string, int> cases[] = {
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
    for (const auto& [path, expected] : cases) {
        const unique_handle made(kiv_create_from_path(path.c_str()));
        const int error = made ? 0 : errno;
        EXPECT_EQ(error, expected) << path;
    }
    EXPECT_EQ(kiv_create_from_path(nullptr), nullptr);
    kiv_destroy(nullptr);
}

TEST_F(libkiv, a_full_queue_drops_and_counts_and_takes_again_once_there_is_room) {
    int queued = 0;
    while (kiv_inc_counter(handle.get(), "fill", "queue", queued) == 0) ++queued;
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

// Children that are forked while other threads send are not to find a lock taken.
TEST_F(libkiv, threads_and_forked_children_lose_nothing_and_keep_their_order) {
    constexpr int thread_count = 8, events_each = 500, child_count = 20;
    kiv_set_wait(handle.get(), 20'000);
    std::vector<std::jthread> threads(thread_count);
    for (std::jthread& thread : threads) {
        thread = std::jthread([this, package = "p" + std::to_string(&thread - threads.data())] {
            for (int count = 0; count < events_each; ++count) {
                EXPECT_EQ(send_counted(handle.get(), package, count), 0);
            }
        });
    }
    std::vector<pid_t> children(child_count);
    for (pid_t& child : children) {
        child = fork();
        if (child != 0) continue;
        alarm(30);  // a deadlock ends by a signal
        _exit(send_counted(handle.get(), "c" + std::to_string(getpid()), 0) == 0 ? 0 : 1);
    }
    std::map<std::string, int> next;
    for (int i = 0; i < thread_count * events_each + child_count; ++i) {
        const auto message = producer_socket->receive();
        ASSERT_TRUE(message) << i;
        const auto [package, count] = parse_counted(*message);
        EXPECT_EQ(count, next[package]++);
    }
    EXPECT_EQ(next.size(), size_t{thread_count + child_count});
    EXPECT_EQ(kiv_dropped(handle.get()), 0u);
    for (const pid_t child : children) {
        int status = -1;
        EXPECT_EQ(waitpid(child, &status, 0), child);
        EXPECT_EQ(status, 0);
    }
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

// What each call sends, and whether it notices a refusal, is shown with kivctl.
TEST_F(libkiv, control_requests_are_handled_when_the_call_returns) {
    kiv_handle* h = handle.get();
    for (const std::string device_id : {"1", "0", "-1", "FAIL"}) {  // that look like answers
        control_server server(directory.path, allowing(device_id));
        char got[KIV_DEVICE_ID_MAX + 1];
        EXPECT_EQ(kiv_get_device_id(h, got), 0);
        EXPECT_EQ(got, device_id);
        EXPECT_EQ(kiv_flush(h), 0);
        EXPECT_EQ(kiv_set_data_collection(h, -7), 0);
        EXPECT_EQ(kiv_announce_config(h), 1);
        EXPECT_EQ(kiv_install_config(h, " \0\n", 3), 1);
        EXPECT_EQ(kiv_next_file(h, 4), 5);
        EXPECT_EQ(kiv_next_file(h, INT32_MAX), -ENOENT);
        EXPECT_EQ(kiv_get_file(h, 7), -ENOENT);
        EXPECT_EQ(kiv_is_probe_active(h, "p", "wanted"), 1);
        EXPECT_EQ(server.take_requests(),
                  " GD IA GD FL IA GD DC 1 IA GD NC GD WC  \0\n NC GD FN 750 0000000004"
                  " GD FN 750 2147483647 GD FG 750 7 PA p wanted"s);
    }
    // not sent, so that no daemon is needed
    const std::string longest(31'173, 'g');
    for (auto* call : {kiv_remove_reports, kiv_next_file, kiv_get_file}) {
        EXPECT_EQ(call(h, -1), -EINVAL);
    }
    for (const char* bad : {"", "a b", "a\n", static_cast<const char*>(nullptr)}) {
        EXPECT_EQ(kiv_set_group_id(h, bad), -EINVAL);
        EXPECT_EQ(kiv_delete_group_id(h, bad), -EINVAL);
        EXPECT_EQ(kiv_replace_group_id(h, bad, "id"), -EINVAL);
        EXPECT_EQ(kiv_replace_group_id(h, "id", bad), -EINVAL);
        EXPECT_EQ(kiv_is_probe_active(h, bad, "n"), -EINVAL);
        EXPECT_EQ(kiv_get_config(h, "p", bad), -EINVAL);
    }
    EXPECT_EQ(kiv_is_probe_active(h, longest.c_str(), "n"), -EMSGSIZE);
    EXPECT_EQ(kiv_get_config(h, longest.c_str(), "n"), -EMSGSIZE);
    EXPECT_EQ(kiv_install_config(h, "", 0), -EINVAL);
    EXPECT_EQ(kiv_install_config(h, nullptr, 1), -EINVAL);
    EXPECT_EQ(kiv_install_config(h, longest.data(), 31'174), -EMSGSIZE);

    control_server server(directory.path, allowing("0", "0"));
    EXPECT_EQ(kiv_install_config(h, longest.data(), 31'173), 0);  // not taken
    EXPECT_EQ(server.take_requests(), " GD WC " + longest + " NC");
    EXPECT_EQ(kiv_announce_config(h), 0);
    (void)server.take_requests();
    EXPECT_EQ(kiv_install_config(h, "\x12\1", 3), 0);
    EXPECT_EQ(kiv_get_config(h, "app", "Settings"), -ENOENT);
    EXPECT_EQ(kiv_next_file(h, 0), 5);
    const auto documented = [](const char* name) {
        return " " + doc_example("requests.md", "hex", name);
    };
    EXPECT_EQ(server.take_requests(), " GD" + documented("write-configuration-request") + " NC" +
                                          documented("get-configuration-request") + " GD" +
                                          documented("next-file-request"));
    EXPECT_EQ(kiv_set_group_id(h, longest.c_str()), 0);
    EXPECT_EQ(kiv_set_group_id(h, (longest + "g").c_str()), -EMSGSIZE);
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
    const answer wrong[] = {
        "2", "10", "OK", "-2", "5x", "2147483648", "0" + std::string(KIV_DEVICE_ID_MAX, ' '), {}};
    for (const answer& each : wrong) {
        const int result = each ? -EPROTO : -ECONNRESET;  // that one hangs up on WC already
        const control_server server(directory.path, [&each](const std::string& request) -> answer {
            if (request == "GD") return "id";
            return request.starts_with("WC") && each ? "" : each;
        });
        SCOPED_TRACE(each.value_or("none"));
        EXPECT_EQ(kiv_is_probe_active(handle.get(), "p", "n"), result);
        EXPECT_EQ(kiv_get_config(handle.get(), "p", "n"), result);
        EXPECT_EQ(kiv_install_config(handle.get(), "x", 1), result);
        EXPECT_EQ(kiv_next_file(handle.get(), 10), result);  // going on with "10" has no end
        EXPECT_EQ(kiv_get_file(handle.get(), 10), result);
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
    const std::pair<control_answer, int> cases[] = {
        {{"OK", {part}}, 0},  // a descriptor
        {{"OK", {part, part}}, -EPROTO},
        {{"OK", {part, part, part, part, part}}, -EPROTO},
        {{"O", {part}}, -EPROTO},
        {{"OKAY", {part}}, -EPROTO},
        {{std::string(KIV_DEVICE_ID_MAX + 1, 'O'), {part}}, -EPROTO},
        {{"FAIL", {part}}, -ENOENT},
    };
    for (const auto& [answer, result] : cases) {
        SCOPED_TRACE(answer.text + std::to_string(answer.descriptors.size()));
        const control_server server(directory.path, [&answer = answer](const std::string& request) {
            return std::optional(request == "GD" ? "id" : answer);
        });
        for (const bool is_file : {false, true}) {
            const int fd =
                is_file ? kiv_get_file(handle.get(), 1) : kiv_get_config(handle.get(), "p", "n");
            EXPECT_EQ(std::min(fd, 0), result);
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
        EXPECT_LT(taken, milliseconds(20000));  // on a busy machine
    };
    {  // one that answers the device id and then hangs
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
    expect_timeout(kiv_flush);     // nobody is accepted
    expect_timeout(kiv_is_alive);  // no room: the one before is still in the backlog
}

}  // namespace
}  // namespace kivd
