#include <fcntl.h>

#include <atomic>

#include "client/fake_daemon.h"
#include "support/outside_tools.h"
#include "support/scratch_directory.h"

namespace kivd {
namespace {

class kivctl : public scratch_directory {
 protected:
    outcome command(const std::string& arguments) const {
        return run(KIVCTL_PATH " --base " + directory + " " + arguments);
    }
};

TEST_F(kivctl, says_what_it_sends_and_what_went_wrong) {
    control_server server(directory, allowing("the id"));
    write_file("payload", "bytes\n");
    const std::string wrong_number = "is not a whole number";
    const std::string wrong_report = "is neither a report number";
    const struct {
        std::string arguments;
        int status;
        std::string output;     // part of it
        std::string sent = "";  // what the daemon got: probe data, or requests with a blank before
    } cases[] = {
        {"event p n", 0, "", "EV p n "},
        {"event save flush alive", 0, "", "EV save flush alive"},
        {"event p n -- --file", 0, "", "EV p n --file"},
        {"event p n '[x]'", 0, "", "EV p n [x]"},
        {"event p n --file payload", 0, "", "EV p n bytes\n"},
        {"event p n --file .", 1, "cannot read ."},
        {"event p n --file /dev/zero", 1, "/dev/zero is too large"},
        {"event p n x --file /none", 2, "excludes"},
        {"event p", 2, "NAME is required"},
        {"event 'a b' n", 1, "holds a blank"},
        {"counter set p n 010", 0, "", "CS p n 10"},
        {"counter set p n -99999999999999999999", 1, "2147483647"},
        {"counter set p n 0x10", 2, wrong_number},
        {"counter inc p n", 0, "", "CI p n 1"},
        {"counter inc p n -2", 0, "", "CI p n -2"},
        {"counter inc p n 1.5", 2, wrong_number},
        {"static p n 'a  b'", 0, "", "SD p n a  b"},
        {"static p n ''", 1, "empty"},
        {"alive", 0, "alive\n", " IA"},
        {"device-id", 0, "the id\n", " GD IA"},
        {"device-id >/dev/full", 1, "No space left", " GD IA"},
        {"flush", 0, "", " GD FL IA"},
        {"save", 0, "", " GD FS IA"},
        {"collection on", 0, "", " GD DC 1 IA"},
        {"remove-report 7", 0, "", " GD RM 7 IA"},
        {"remove-report all", 0, "", " GD RM 0 IA"},
        {"group add a", 0, "", " SG a IA"},
        {"group delete a", 0, "", " DG a IA"},
        {"group replace new old", 0, "", " RG new old IA"},
        {"remove-report 0", 2, wrong_report},
        {"remove-report 2147483648", 2, wrong_report},
        {"collection maybe", 2, "\"maybe\" is neither"},
        {"group add 'a b'", 1, "holds a blank"},
        {"wanted p wanted", 0, "wanted\n", " PA p wanted"},
        {"wanted p n >&2", 1, "", " PA p n"},
        {"frobnicate", 2, "unexpected \"frobnicate\""},
        {"", 2, "required"},
        {"--timeout 0 alive", 2, "--timeout"},
        {"--base none save", 3, "no daemon listens in "},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.arguments);
        const auto [status, output] = command(c.arguments);
        EXPECT_EQ(status, c.status) << output;
        EXPECT_NE(output.find(c.output), std::string::npos) << output;
        EXPECT_TRUE(output == "not wanted\n" || output.starts_with("kivctl: ") == (status != 0))
            << output;
        EXPECT_EQ(next_packet() + server.take_requests(), c.sent);
    }
}

TEST_F(kivctl, hands_over_configurations_and_fetches_parts_and_files) {
    const std::string content("\0part\n", 6);
    write_file("file", content);
    const unique_fd file(open("file", O_RDONLY | O_CLOEXEC));
    std::atomic<int> last = 0;
    std::atomic<bool> is_taken = true, is_allowed = true;
    control_server server(directory, [&](const std::string& request) {
        if (request == "GC p n" || request == "FG 750 3" || request == "FG 750 5") {
            return std::optional(control_answer("OK", {file.get()}));
        }
        if (!request.starts_with("FN 750 "))
            return allowing(is_allowed ? "id" : "", is_taken ? "1" : "0")(request);
        const int number = std::max(2, std::stoi(request.substr(7)));
        return std::optional(control_answer(number < last ? std::to_string(number + 1) : "-1"));
    });
    const auto install = [](size_t size) {
        write_file(std::to_string(size), std::string(size, 'c'));
        return "config install " + std::to_string(size);
    };
    constexpr int refused = -1;      // the configuration
    constexpr int not_allowed = -2;  // the caller
    const struct {
        std::string arguments;
        int last;  // files have the numbers 3 to this one; of them 3 and 5 are there
        int status;
        std::string output;  // all of it, or a part of a complaint
        std::string sent = "";
    } cases[] = {
        {install(31'173), 0, 0, "taken\n", " GD WC " + std::string(31'173, 'c') + " NC"},
        {"config install - <" + install(1).substr(15), 0, 0, "taken\n", " GD WC c NC"},
        {install(1), refused, 1, "did not take the configuration", " GD WC c NC"},
        {install(0), 0, 1, "0 is empty"},
        {install(31'174), 0, 1, "has 31174 bytes, but a request carries at most 31173"},
        {install(204'799), 0, 1, "as input/config, then run"},
        {install(204'800), 0, 1, "which has at most 204799 bytes"},
        {"config announce", 0, 0, "taken\n", " GD NC"},
        {"config announce", refused, 1, "no input/config in its directory", " GD NC"},
        {"config announce", not_allowed, 1, "refused", "*"},
        {"flush", not_allowed, 1, "refused", "*"},
        {"config get p n", 0, 0, content, " GC p n"},
        {"config get p n >/dev/full", 0, 1, "No space left", " GC p n"},
        {"config get q n", 0, 1, "has no part \"n\" of the package \"q\"", " GC q n"},
        {"files list", 2, 0, "", " GD FN 750 0000000000"},
        {"files list", 1'004, 0, "3  6 bytes\n5  6 bytes\n", "*"},
        {"files list 2>&1 >/dev/null", 1'005, 1,
         "gave up at number 1005: none of the last 1000 files is there\n", "*"},
        {"files list >/dev/full", 5, 1, "to standard output: No space left on device\n", "*"},
        {"files get 3", 5, 0, content, " GD FG 750 3"},
        {"files get 5 -o saved", 5, 0, "", " GD FG 750 5"},
        {"files get 5 -o /dev/full", 5, 1, "cannot write /dev/full: No space left", "*"},
        {"files get 5 -o /none/x", 5, 1, "cannot create /none/x: No such file or directory", "*"},
        {"files get 4", 5, 1, "there is no diagnostics file 4\n", " GD FG 750 4"},
        {"files get 0", 5, 2, "NUMBER: \"0\" is not a file number, 1 or more (see kivctl --help)"},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.arguments);
        last = c.last;
        is_taken = c.last >= 0;
        is_allowed = c.last != not_allowed;
        lseek(file.get(), 0, SEEK_SET);
        const auto [status, output] = command(c.arguments);
        EXPECT_EQ(status, c.status);
        EXPECT_TRUE(status != 0 ? output.find(c.output) != std::string::npos : output == c.output);
        EXPECT_EQ(output.starts_with("kivctl: "), c.status != 0) << output;
        const std::string sent = server.take_requests();
        EXPECT_TRUE(c.sent == "*" || sent == c.sent) << sent;
    }
    EXPECT_EQ(read_file("saved"), content);
}

}  // namespace
}  // namespace kivd
