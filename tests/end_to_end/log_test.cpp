// What clients can do to the log.
#include <regex>

#include "daemon_test.h"

namespace kivd {
namespace {

using enum socket_kind;

class daemon_log : public daemon_test {};

TEST_F(daemon_log, shows_what_clients_send_whole_and_harmless) {
    const daemon_process daemon = start();
    const std::string token(20000, 'x');
    request(
        {"EV " + token,
         "EV "
         "a\x1b[2J\x7f\vb\xff\x9b\xc2\x9b\xe2\x80\xa8\xe2\x81\xa6ä₀\xed\xa0\x80\xf4\x90\x80\x80"});
    for (const std::string& shown : {token, "a [2J  b??        ä₀???????"s}) {
        EXPECT_TRUE(daemon.wait_log("dropping. [" + shown + ":null]\n")) << daemon.log();
    }
}

TEST_F(daemon_log, has_so_many_lines_of_clients_and_all_others) {
    const daemon_process daemon = start();
    constexpr int count = 500;
    for (int i = 0; i < count; ++i) request({"XY", "RM 7"});
    EXPECT_EQ(daemon.count_in_log("W kivd-util: Failed to delete output/kiv_7"), count);
    const auto told = [&] {
        size_t all = daemon.count_in_log("E kivd: Bad command: 88/89");
        const std::string log = daemon.log();
        const std::regex more(R"(W kivd: (\d+) more like this\n)");
        for (std::sregex_iterator each(log.begin(), log.end(), more), end; each != end; ++each) {
            all += std::stoul((*each)[1]);
        }
        return all;
    };
    EXPECT_TRUE(wait_until([&] { return told() == count; })) << told();
    EXPECT_LT(daemon.count_in_log("Bad command"), 450U);  // 200 in a second
}

}  // namespace
}  // namespace kivd
