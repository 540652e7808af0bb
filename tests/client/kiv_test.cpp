#include "kiv.h"

#include <fcntl.h>
#include <sys/resource.h>
#include <sys/wait.h>

#include <chrono>
#include <map>
#include <memory>
#include <semaphore>

#include "bench/daemon_process.h"
#include "fake_daemon.h"
#include "support/scratch_directory.h"

namespace kivd {
namespace {

using unique_handle = std::unique_ptr<kiv_handle, releaser<kiv_destroy>>;

class libkiv : public scratch_directory {
 protected:
    unique_handle handle{kiv_create_from_path(directory.c_str())};
    kiv_handle* const h = handle.get();
};

int send_event(kiv_handle* handle, const std::string& package, const std::string& name,
               const std::string& payload) {
    return kiv_add_event(handle, package.c_str(), name.c_str(), payload.data(), payload.size());
}

TEST_F(libkiv, producing_calls_send_these_bytes_or_refuse) {
    using outcome = std::pair<int, std::string>;  // the result, and what was sent
    const outcome invalid(-EINVAL, ""), too_long(-EMSGSIZE, ""), out_of_range(-ERANGE, "");
    const auto of = [this](int result) { return outcome(result, next_packet()); };
    const auto event = [&](const std::string& p, const std::string& n, const std::string& bytes) {
        return of(send_event(h, p, n, bytes));
    };
    const auto fixed = [&](const std::string& p, const std::string& n, const std::string& value) {
        return of(kiv_set_static_data(h, p.c_str(), n.c_str(), value.c_str()));
    };
    const std::string package(200, 'p'), name(56, 'n'), id = package + " " + name + " ";
    const std::string payload("\0\n x", 4), largest(30'720, 'x');
    EXPECT_EQ(of(kiv_add_event(h, "p", "n", nullptr, 0)), outcome(0, "EV p n "));
    EXPECT_EQ(event("p", "n", payload), outcome(0, "EV p n " + payload));
    EXPECT_EQ(event(package, name, largest), outcome(0, "EV " + id + largest));
    EXPECT_EQ(event("p", "n", largest + "x"), too_long);
    EXPECT_EQ(event(package, name + "n", ""), too_long);
    EXPECT_EQ(of(kiv_add_event(h, "p", "n", nullptr, 1)), invalid);
    EXPECT_EQ(of(kiv_set_counter(h, "p", "n", INT32_MAX)), outcome(0, "CS p n 2147483647"));
    EXPECT_EQ(of(kiv_inc_counter(h, "p", "n", INT32_MIN)), outcome(0, "CI p n -2147483648"));
    EXPECT_EQ(of(kiv_set_counter(h, "p", "n", INT32_MAX + 1LL)), out_of_range);
    EXPECT_EQ(of(kiv_inc_counter(h, "p", "n", INT32_MIN - 1LL)), out_of_range);
    EXPECT_EQ(of(kiv_inc_counter(h, nullptr, "n", 1)), invalid);

    const std::string longest_value(31'176 - 3 - id.size(), 'v');
    EXPECT_EQ(fixed("p", "n", " a\tb\n"), outcome(0, "SD p n  a\tb\n"));
    EXPECT_EQ(fixed(package, name, longest_value), outcome(0, "SD " + id + longest_value));
    EXPECT_EQ(fixed(package, name, longest_value + "v"), too_long);
    EXPECT_EQ(fixed("p", "n", ""), invalid);
    EXPECT_EQ(of(kiv_set_static_data(h, "p", "n", nullptr)), invalid);
    for (const char* bad : {"", " ", "a b", "a ", "\ta", "a\rb", "a\n"}) {
        EXPECT_EQ(event(bad, "n", "x"), invalid) << bad;
        EXPECT_EQ(fixed("p", bad, "x"), invalid) << bad;
    }
    EXPECT_EQ(kiv_dropped(h), 0u);
}

TEST_F(libkiv, finds_the_daemon_or_says_why_not) {
    // a directory whose sockets have the longest path that an address holds
    const size_t left = 107 - std::string("/kiv_cl").size() - directory.size() - 1;
    const std::string deep = directory + "/" + std::string(left, 'd');
    for (const std::string& path : {deep, "stale"s}) fs::create_directory(path);
    const unique_fd deep_socket = bind_socket(SOCK_DGRAM, deep + "/kiv_cl");
    { const unique_fd closed = bind_socket(SOCK_DGRAM, "stale/kiv_cl"); }
    const size_t descriptors = open_descriptors();
    const std::pair<std::string, int> cases[] = {
        {directory, 0},          {directory + "/", 0},
        {deep + "/", 0},         {deep + "d", ENAMETOOLONG},
        {"none", ENOENT},        {std::string(5000, 'd'), ENAMETOOLONG},
        {"stale", ECONNREFUSED}, {"", EINVAL},
    };
    for (const auto& [path, expected] : cases) {
        const unique_handle made(kiv_create_from_path(path.c_str()));
        const int error = made ? 0 : errno;
        EXPECT_EQ(error, expected) << path;
    }
    EXPECT_EQ(kiv_create_from_path(nullptr), nullptr);
    kiv_destroy(nullptr);
    EXPECT_EQ(open_descriptors(), descriptors);
}

TEST_F(libkiv, a_full_queue_drops_and_counts_and_takes_again_once_there_is_room) {
    int queued = 0;
    while (kiv_inc_counter(h, "fill", "queue", queued) == 0) ++queued;
    EXPECT_EQ(kiv_dropped(h), 1u);
    kiv_set_wait(h, 50);
    const auto start = std::chrono::steady_clock::now();
    EXPECT_EQ(send_event(h, "p", "n", ""), -EAGAIN);
    EXPECT_GE(std::chrono::steady_clock::now() - start, std::chrono::milliseconds(50));
    EXPECT_EQ(kiv_dropped(h), 2u);
    for (int i = 0; i < queued; ++i) {
        EXPECT_EQ(next_packet(), "CI fill queue " + std::to_string(i));
    }
    EXPECT_EQ(send_event(h, "p", "n", "2"), 0);
    EXPECT_EQ(next_packet(), "EV p n 2");
}

// Children that are forked while other threads send are not to find a lock taken.
TEST_F(libkiv, threads_and_forked_children_lose_nothing_and_keep_their_order) {
    constexpr int events_each = 500, child_count = 20;
    kiv_set_wait(h, 20'000);
    std::vector<std::jthread> threads;
    for (const char* name : {"a", "b", "c", "d", "e", "f", "g", "h"}) {
        threads.emplace_back([this, name] {
            for (int i = 0; i < events_each; ++i) {
                EXPECT_EQ(send_event(h, "p", name, std::to_string(i)), 0);
            }
        });
    }
    for (int i = 0; i < child_count; ++i) {
        if (fork() != 0) continue;
        alarm(30);  // a deadlock ends by a signal
        _exit(send_event(h, "p", "child" + std::to_string(i), "0") == 0 ? 0 : 1);
    }
    std::map<std::string, int> next;
    for (int i = 0; i < 8 * events_each + child_count; ++i) {
        char name[16];
        int count = -1;
        std::string packet;
        ASSERT_TRUE(wait_until([&] { return !(packet = next_packet()).empty(); })) << i;
        EXPECT_EQ(sscanf(packet.c_str(), "EV p %15s %d", name, &count), 2) << packet;
        EXPECT_EQ(count, next[name]++);
    }
    int status = 0;
    while (wait(&status) > 0) EXPECT_EQ(status, 0);
}

TEST_F(libkiv, outlives_a_restart_of_the_daemon) {
    receiver = bind_socket(SOCK_DGRAM, "kiv_cl");  // unseen by the handle
    EXPECT_EQ(send_event(h, "p", "n", "2"), 0);
    EXPECT_EQ(next_packet(), "EV p n 2");
    receiver.reset();
    for (int i = 0; i < 2; ++i) EXPECT_EQ(send_event(h, "p", "n", ""), -ECONNREFUSED);
    fs::remove("kiv_cl");
    EXPECT_EQ(send_event(h, "p", "n", ""), -ENOENT);
    receiver = bind_socket(SOCK_DGRAM, "kiv_cl");
    EXPECT_EQ(send_event(h, "p", "n", "6"), 0);
    EXPECT_EQ(next_packet(), "EV p n 6");
}

// What each call sends, and whether it notices a refusal, is shown with kivctl.
TEST_F(libkiv, control_requests_are_handled_when_the_call_returns) {
    for (const std::string device_id : {"1", "0", "-1", "FAIL"}) {  // that look like answers
        control_server server(directory, allowing(device_id));
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
    EXPECT_EQ(kiv_get_config(h, longest.c_str(), "n"), -EMSGSIZE);
    EXPECT_EQ(kiv_install_config(h, "", 0), -EINVAL);
    EXPECT_EQ(kiv_install_config(h, longest.data(), 31'174), -EMSGSIZE);

    control_server server(directory, allowing("0", "0"));
    EXPECT_EQ(kiv_install_config(h, longest.data(), 31'173), 0);  // not taken
    EXPECT_EQ(server.take_requests(), " GD WC " + longest + " NC");
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
    const std::string too_long = "0" + std::string(KIV_DEVICE_ID_MAX, ' ');
    const answer wrong[] = {"2", "10", "OK", "-2", "5x", "2147483648", too_long, {}};
    for (const answer& each : wrong) {
        SCOPED_TRACE(each.value_or("none"));
        const int result = each ? -EPROTO : -ECONNRESET;  // that one hangs up on WC already
        const control_server server(directory, [&each](const std::string& request) -> answer {
            if (request == "GD") return "id";
            return request.starts_with("WC") && each ? "" : each;
        });
        EXPECT_EQ(kiv_is_alive(h), result);
        EXPECT_EQ(kiv_flush(h), result);
        EXPECT_EQ(kiv_is_probe_active(h, "p", "n"), result);
        EXPECT_EQ(kiv_get_config(h, "p", "n"), result);
        EXPECT_EQ(kiv_install_config(h, "x", 1), result);
        EXPECT_EQ(kiv_next_file(h, 10), result);  // going on with "10" has no end
    }
    {
        const control_server server(directory, allowing(too_long));
        EXPECT_EQ(kiv_flush(h), -EPROTO);
    }
    EXPECT_EQ(kiv_get_config(h, "p", "n"), -ECONNREFUSED);  // not: no such part
    fs::remove("kiv_co");
    EXPECT_EQ(kiv_is_alive(h), -ENOENT);
}

TEST_F(libkiv, a_part_or_file_comes_as_one_descriptor_and_all_others_are_closed) {
    const std::string path = directory + "/part";
    write_file(path, "content");
    const unique_fd file(open(path.c_str(), O_RDONLY | O_CLOEXEC));
    const int part = file.get();
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
        const control_server server(directory, [&answer = answer](const std::string& request) {
            return std::optional(request == "GD" ? "id" : answer);
        });
        for (const bool is_file : {false, true}) {
            const unique_fd fd(is_file ? kiv_get_file(h, 1) : kiv_get_config(h, "p", "n"));
            EXPECT_EQ(std::min(fd.get(), 0), result);
            EXPECT_EQ(open_descriptors(path), fd.ok() ? 2U : 1U);
            EXPECT_TRUE(!fd.ok() || fcntl(fd.get(), F_GETFD) == FD_CLOEXEC);
        }
        EXPECT_EQ(kiv_is_probe_active(h, "p", "n"), -EPROTO);
        EXPECT_EQ(open_descriptors(path), 1U);
    }
}

TEST_F(libkiv, says_when_the_process_has_no_room_for_a_part_or_a_connection) {
    const unique_fd part(open("/dev/null", O_RDONLY | O_CLOEXEC));
    rlimit limit;
    getrlimit(RLIMIT_NOFILE, &limit);
    const auto fill_process = [&] {
        const unique_fd lowest_free(dup(part.get()));
        const rlimit full = {static_cast<rlim_t>(lowest_free.get()), limit.rlim_max};
        setrlimit(RLIMIT_NOFILE, &full);
    };
    const control_server server(directory, [&](const std::string&) {
        fill_process();  // which is the caller's as well
        return std::optional(control_answer("OK", {part.get()}));
    });
    EXPECT_EQ(kiv_get_config(h, "p", "n"), -EMFILE);
    setrlimit(RLIMIT_NOFILE, &limit);
    fill_process();
    EXPECT_EQ(kiv_is_alive(h), -EMFILE);
    setrlimit(RLIMIT_NOFILE, &limit);
}

TEST_F(libkiv, a_silent_daemon_is_given_up_at_the_deadline) {
    using std::chrono::milliseconds, std::chrono::steady_clock;
    kiv_set_timeout(h, 60);
    const auto expect_timeout = [this](int (*call)(kiv_handle*)) {
        const auto start = steady_clock::now();
        EXPECT_EQ(call(h), -ETIMEDOUT);
        EXPECT_GE(steady_clock::now() - start, milliseconds(59));
    };
    {  // one that answers the device id and then hangs
        std::binary_semaphore end(0);
        const control_server server(directory, [&end](const std::string& request) {
            if (request == "IA" || request == "NC") end.acquire();
            return std::optional<std::string>(request == "GD" ? "id" : "");
        });
        for (auto* call : {kiv_flush, kiv_announce_config}) {
            expect_timeout(call);
            end.release();
        }
    }
    const unique_fd control_socket = bind_socket(SOCK_SEQPACKET, "kiv_co");
    listen(control_socket.get(), 0);
    expect_timeout(kiv_flush);     // nobody is accepted
    expect_timeout(kiv_is_alive);  // no room: the one before is still in the backlog
}

}  // namespace
}  // namespace kivd
