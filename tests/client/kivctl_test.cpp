#include <gtest/gtest.h>
#include <sys/wait.h>

#include <fstream>

#include "fake_daemon.h"

namespace kivd {
namespace {

struct outcome {
    int status;
    std::string output;  // standard output and error
};

outcome run_kivctl(const std::string& arguments) {
    FILE* pipe = popen((KIVCTL_PATH " 2>&1 " + arguments).c_str(), "re");
    if (pipe == nullptr) abort();
    std::string output(10'000, '\0');
    output.resize(fread(output.data(), 1, output.size(), pipe));
    const int status = pclose(pipe);
    return {WIFEXITED(status) ? WEXITSTATUS(status) : -1, output};
}

TEST(kivctl, says_what_it_sends_and_what_went_wrong) {
    const socket_directory directory, empty;
    const bound_socket producer_socket(SOCK_DGRAM, directory.path + "/kiv_cl");
    control_server server(directory.path, allowing("the id"));
    const std::string wrong_number = "is not a whole number";
    const std::string wrong_report = "is neither a report number";
    const struct {
        std::string arguments;
        int status;
        std::string output;  // part of it
        std::string sent;    // what the daemon got
    } cases[] = {
        {"event p n", 0, "", "EV p n "},
        {"event save flush alive", 0, "", "EV save flush alive"},
        {"event p n -- --file", 0, "", "EV p n --file"},
        {"event p n '[x]'", 0, "", "EV p n [x]"},
        {"event p n --file - <" + directory.path + "/payload", 0, "", "EV p n bytes\n"},
        {"event p n --file " + directory.path + "/payload", 0, "", "EV p n bytes\n"},
        {"event p n --file " + directory.path, 1, "cannot read " + directory.path, ""},
        {"event p n --file /none", 1, "cannot open /none", ""},
        {"event p n --file /dev/zero", 1, "/dev/zero is too large", ""},
        {"event p n x --file /none", 2, "excludes", ""},
        {"event p", 2, "NAME is required", ""},
        {"event 'a b' n", 1, "holds a blank", ""},
        {"counter set p n 010", 0, "", "CS p n 10"},
        {"counter set p n 2147483648", 1, "2147483647", ""},
        {"counter set p n -99999999999999999999", 1, "2147483647", ""},
        {"counter set p n 0x10", 2, wrong_number, ""},
        {"counter inc p n", 0, "", "CI p n 1"},
        {"counter inc p n -2", 0, "", "CI p n -2"},
        {"counter inc p n 1.5", 2, wrong_number, ""},
        {"static p n 'a  b'", 0, "", "SD p n a  b"},
        {"static p n ''", 1, "empty", ""},
        {"alive", 0, "alive\n", "IA"},
        {"device-id", 0, "the id\n", "GD IA"},
        {"device-id >/dev/full", 1, "No space left", "GD IA"},
        {"flush", 0, "", "GD FL IA"},
        {"save", 0, "", "GD FS IA"},
        {"collection on", 0, "", "GD DC 1 IA"},
        {"collection off", 0, "", "GD DC 0 IA"},
        {"remove-report 7", 0, "", "GD RM 7 IA"},
        {"remove-report all", 0, "", "GD RM 0 IA"},
        {"group add a", 0, "", "SG a IA"},
        {"group delete a", 0, "", "DG a IA"},
        {"group replace new old", 0, "", "RG new old IA"},
        {"remove-report 0", 2, wrong_report, ""},
        {"remove-report 1x", 2, wrong_report, ""},
        {"remove-report 2147483648", 2, wrong_report, ""},
        {"collection maybe", 2, "\"maybe\" is neither", ""},
        {"group add 'a b'", 1, "holds a blank", ""},
        {"frobnicate", 2, "unexpected \"frobnicate\"", ""},
        {"", 2, "required", ""},
        {"--timeout 0 alive", 2, "--timeout", ""},
        {"--help", 0, "remove-report", ""},
        {"--base " + empty.path + " save", 3, "no daemon listens in " + empty.path, ""},
    };
    std::ofstream(directory.path + "/payload") << "bytes\n";
    for (const auto& c : cases) {
        SCOPED_TRACE(c.arguments);
        const auto [status, output] = run_kivctl("--base " + directory.path + " " + c.arguments);
        EXPECT_EQ(status, c.status) << output;
        EXPECT_NE(output.find(c.output), std::string::npos) << output;
        EXPECT_EQ(output.starts_with("kivctl: "), c.status != 0) << output;
        std::string sent = producer_socket.receive_now().value_or("");
        for (const auto& request : server.take_requests()) {
            sent += (sent.empty() ? "" : " ") + request;
        }
        EXPECT_EQ(sent, c.sent);
    }
}

TEST(kivctl, tells_a_refused_caller) {
    const socket_directory directory;
    const bound_socket producer_socket(SOCK_DGRAM, directory.path + "/kiv_cl");
    const control_server server(directory.path, refusing());
    for (const char* command : {"flush", "device-id", "remove-report all"}) {
        SCOPED_TRACE(command);
        const auto [status, output] = run_kivctl("--base " + directory.path + " " + command);
        EXPECT_EQ(status, 1);
        EXPECT_NE(output.find("refused"), std::string::npos) << output;
    }
}

}  // namespace
}  // namespace kivd
