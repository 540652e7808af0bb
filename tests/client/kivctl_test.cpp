#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/wait.h>

#include <atomic>
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

TEST(kivctl, hands_over_configurations_and_prints_their_parts) {
    const socket_directory directory;
    const bound_socket producer_socket(SOCK_DGRAM, directory.path + "/kiv_cl");
    const std::string content("\0part\n", 6);
    std::ofstream(directory.path + "/part") << content;
    const int part = open((directory.path + "/part").c_str(), O_RDONLY | O_CLOEXEC);
    std::atomic<bool> is_taken = true;
    control_server server(directory.path, [&](const std::string& request) {
        if (request == "GC p n") return std::optional(control_answer("OK", {part}));
        return allowing("id", is_taken ? "1" : "0")(request);
    });
    const auto file = [&](size_t size) {
        const std::string path = directory.path + "/" + std::to_string(size);
        std::ofstream(path) << std::string(size, 'c');
        return path;
    };
    const std::string install = "config install ", install_input = install + "- <";
    const struct {
        std::string arguments;
        bool is_taken;
        int status;
        std::string output;  // part of it
        std::string sent;
    } cases[] = {
        {install + file(31'173), true, 0, "taken\n", "GD WC " + std::string(31'173, 'c') + " NC "},
        {install_input + file(1), true, 0, "taken\n", "GD WC c NC "},
        {install + file(1), false, 1, "did not take the configuration", "GD WC c NC "},
        {install + file(0), true, 1, "/0 is empty", ""},
        {install + file(31'174), true, 1, "has 31174 bytes, but a request carries at most 31173",
         ""},
        {install + file(204'799), true, 1, "as input/config, then run", ""},
        {install + file(204'800), true, 1, "which has at most 204799 bytes", ""},
        {install + directory.path, true, 1, "cannot read " + directory.path, ""},
        {install + "/none", true, 1, "cannot open /none", ""},
        {"config announce", true, 0, "taken\n", "GD NC "},
        {"config announce", false, 1, "no input/config in its directory", "GD NC "},
        {"config get p n", true, 0, content, "GC p n "},
        {"config get p n >/dev/full", true, 1, "No space left", "GC p n "},
        {"config get q n", true, 1, "has no part \"n\" of the package \"q\"", "GC q n "},
        {"wanted p wanted", true, 0, "wanted\n", "PA p wanted "},
        {"wanted p n", true, 1, "not wanted\n", "PA p n "},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.arguments);
        is_taken = c.is_taken;
        lseek(part, 0, SEEK_SET);
        const auto [status, output] = run_kivctl("--base " + directory.path + " " + c.arguments);
        EXPECT_EQ(status, c.status) << output;
        EXPECT_NE(output.find(c.output), std::string::npos) << output;
        EXPECT_EQ(output.starts_with("kivctl: "), c.status != 0 && c.output != "not wanted\n");
        std::string sent;
        for (const auto& request : server.take_requests()) sent += request + " ";
        EXPECT_EQ(sent, c.sent);
    }
    close(part);
}

TEST(kivctl, lists_and_fetches_the_files_that_are_there) {
    const socket_directory directory;
    const bound_socket producer_socket(SOCK_DGRAM, directory.path + "/kiv_cl");
    const std::string content("\x12\0file\n", 7), saved = directory.path + "/saved";
    std::ofstream(directory.path + "/file") << content;
    const int file = open((directory.path + "/file").c_str(), O_RDONLY | O_CLOEXEC);
    // numbers 3 to `last`, of which 3 and 5 have a file
    std::atomic<int> last = 5;
    control_server server(directory.path, [&](const std::string& request) {
        if (request == "FG 750 3" || request == "FG 750 5") {
            return std::optional(control_answer("OK", {file}));
        }
        if (!request.starts_with("FN 750 ")) return allowing("id")(request);
        const int number = std::max(2, std::stoi(request.substr(7)));
        return std::optional(control_answer(number < last ? std::to_string(number + 1) : "-1"));
    });
    const struct {
        std::string arguments;
        int last, status;
        std::string output;
    } cases[] = {
        {"files list", 2, 0, ""},
        {"files list", 5, 0, "3  7 bytes\n5  7 bytes\n"},
        {"files list", 1'004, 0, "3  7 bytes\n5  7 bytes\n"},
        {"files list 2>&1 >/dev/null", 1'005, 1,
         "kivctl: gave up at number 1005: none of the last 1000 files is there\n"},
        {"files list >/dev/full", 5, 1,
         "kivctl: cannot write to standard output: No space left on device\n"},
        {"files get 3", 5, 0, content},
        {"files get 5 -o " + saved, 5, 0, ""},
        {"files get 5 -o /dev/full", 5, 1,
         "kivctl: cannot write /dev/full: No space left on device\n"},
        {"files get 5 -o " + saved + "/none", 5, 1,
         "kivctl: cannot create " + saved + "/none: Not a directory\n"},
        {"files get 4", 5, 1, "kivctl: there is no diagnostics file 4\n"},
        {"files get 0", 5, 2,
         "kivctl: NUMBER: \"0\" is not a file number, 1 or more (see kivctl --help)\n"},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.arguments);
        last = c.last;
        lseek(file, 0, SEEK_SET);
        const auto [status, output] = run_kivctl("--base " + directory.path + " " + c.arguments);
        EXPECT_EQ(status, c.status);
        EXPECT_EQ(output, c.output);
    }
    std::ifstream copy(saved);
    EXPECT_EQ(std::string(std::istreambuf_iterator<char>(copy), {}), content);
    close(file);
}

TEST(kivctl, tells_a_refused_caller) {
    const socket_directory directory;
    const bound_socket producer_socket(SOCK_DGRAM, directory.path + "/kiv_cl");
    const control_server server(directory.path, refusing());
    const auto commands = {"flush",
                           "device-id",
                           "remove-report all",
                           "config announce",
                           "config install /etc/passwd",
                           "files list",
                           "files get 1"};
    for (const char* command : commands) {
        SCOPED_TRACE(command);
        const auto [status, output] = run_kivctl("--base " + directory.path + " " + command);
        EXPECT_EQ(status, 1);
        EXPECT_NE(output.find("refused"), std::string::npos) << output;
    }
}

}  // namespace
}  // namespace kivd
