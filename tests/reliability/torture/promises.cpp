#include "reliability/torture/promises.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/file.h>

#include <algorithm>
#include <filesystem>
#include <iterator>
#include <regex>

#include "reliability/torture/kept_data.h"
#include "support/scratch_directory.h"

namespace kivd {
namespace {

// What a start may say of a file that was begun and is not yet one.
const std::regex described_at_start(
    "kivd-conf: (Failed to (open /system/etc/kivd.conf|(unpack|verify) configuration)|Corrupt file)"
    "|kivd-util: Failed to read file: No data available|kivd-error: Tried to generate error probe "
    "data");
const std::regex lasting_file(
    "events|counters\\.txt|sdata\\.txt|kivd\\.state|header_info\\.conf"
    "|config_list\\.txt|conf_[0-9]+\\.bin|filters\\.txt|qz|qz_compressed");

void append(std::vector<int>& to, const std::vector<int>& more) {
    to.insert(to.end(), more.begin(), more.end());
}

std::vector<int> all_ids(const std::map<int, records>& files) {
    std::vector<int> ids;
    for (const auto& [number, file] : files) append(ids, file.ids);
    return ids;
}

void expect_all(const std::set<int>& wanted, const std::set<int>& there) {
    for (const int id : wanted) EXPECT_TRUE(there.contains(id)) << id << " is lost";
}

void expect_once_in_order(const std::vector<int>& ids, const std::set<int>& sent) {
    std::map<int, int> last;
    for (const int id : ids) {
        EXPECT_TRUE(sent.contains(id)) << id << " was never sent";
        EXPECT_LT(std::exchange(last[id / ids_of_a_sender], id), id);
    }
}

// A compactor that is killed when its report is there leaves what it has made it of.
bool is_reported(const std::vector<int>& flushed, const std::vector<int>& reported) {
    const auto there = [&](int id) { return std::ranges::find(reported, id) != reported.end(); };
    const bool any = std::ranges::any_of(flushed, there);
    EXPECT_TRUE(!any || std::ranges::all_of(flushed, there)) << "half of it is reported";
    return any;
}

bool is_configured() {
    return ask(connect_client(socket_kind::packets).get(), "GC kivd RunActions") == "OK";
}

}  // namespace

daemon_process launch(std::vector<std::string> before) {
    const fs::path directory = fs::current_path();
    const std::string keys = directory.parent_path() / "keys/";
    before.insert(before.end(), {KIVD_PATH, "-D", "-C", "-b", directory, "-c", keys});
    return {before.front(), {{before.begin() + 1, before.end()}}};
}

size_t errors(const daemon_process& daemon) {
    return daemon.count_in_log(" E ") -
           daemon.count_in_log(" E kivd-conf: Failed to open /system/etc/kivd.conf.");
}

void wait_children(const daemon_process& daemon) {
    const std::string pid = std::to_string(daemon.pid());
    const std::string children = "/proc/" + pid + "/task/" + pid + "/children";
    EXPECT_TRUE(wait_until([&] { return read_file(children).empty(); })) << "children that stay";
}

void wait_orphans() {
    const unique_fd lock(open("kivd.pid", O_RDWR | O_CLOEXEC));
    const auto is_free = [&] { return !lock.ok() || flock(lock.get(), LOCK_EX | LOCK_NB) == 0; };
    EXPECT_TRUE(wait_until(is_free)) << "processes that stay";
}

void install_report_key(journal& noted) {
    if (exists("../keys/kiv_report.pem")) return;
    fs::copy_file("../../kiv_report.pem", "../keys/kiv_report.pem");
    noted.plain_reports = read_kept_data().reports.size();
}

bool carry_out(const exchange& wanted, const daemon_process& daemon, journal& noted) {
    const std::string request = wanted.request;
    if (request == "FL" || request == "NC") note_seen(noted);
    const size_t errors_before = errors(daemon);
    std::vector<std::string> packets;
    std::set<int> ids[2];
    for (const bool logged : {false, true}) {
        for (const size_t size : logged ? wanted.logged : wanted.events) {
            const int id = *ids[logged].insert(++noted.last_id).first;
            packets.push_back(event_request(logged ? diag_package : plain_package, id, size));
            noted.sent.insert(id);
        }
    }
    if (wanted.values) {
        const std::string value = std::to_string(++noted.last_value);
        packets.insert(packets.end(), {"CS p counter " + value, "SD p static " + value});
    }
    if (request == "NC") packets.push_back("WC " + read_file("../../config"));
    if (request == "FL" || request == "FS") packets.push_back(request);

    const unique_fd client = connect_client(socket_kind::packets);
    for (const std::string& packet : packets) {
        if (!send_text(client.get(), packet)) return false;
    }
    const bool refused = request == "NC" && ask(client.get(), "NC") == "0";
    EXPECT_FALSE(refused && noted.kills_only);
    const std::string device_id = ask(client.get(), "GD");
    if (ask(client.get(), "IA") != "1") return false;
    wait_children(daemon);
    if (errors(daemon) != errors_before || !noted.acknowledges) return true;
    noted.device_id = device_id;
    if (noted.configured) noted.logged.insert(ids[1].begin(), ids[1].end());
    for (std::set<int>& each : ids) noted.kept.merge(each);
    if (request == "FS") noted.saved_value = noted.last_value;
    if (request == "NC") noted.configured = is_configured();
    return true;
}

std::set<int> check_files(const journal& noted) {
    const kept_data data = read_kept_data();
    for (int last = 0; const auto& [number, report] : data.reports) {
        EXPECT_TRUE(report.whole || noted.may_tear) << "kiv_" << number;
        EXPECT_TRUE(number == ++last || noted.may_prune) << "kiv_" << number;
        const bool was_plain = std::cmp_less_equal(number, noted.plain_reports);
        EXPECT_TRUE(report.sealed || was_plain) << "kiv_" << number << " is readable";
    }
    std::vector<int> ids = all_ids(data.reports);
    if (!is_reported(data.flushed.ids, ids)) append(ids, data.flushed.ids);
    append(ids, data.unfinished.ids);
    expect_once_in_order(ids, noted.sent);
    std::set<int> there = noted.seen;
    there.insert(ids.begin(), ids.end());
    expect_all(noted.kept, there);

    const std::vector<int> logged = all_ids(data.diagnostics);
    expect_once_in_order(logged, noted.sent);
    expect_all(noted.logged, {logged.begin(), logged.end()});
    const int64_t counter = read_value("private/counters.txt", "counter");
    EXPECT_TRUE(counter >= noted.saved_value && counter <= noted.last_value) << counter;
    const int64_t text = read_value("private/sdata.txt", "static");
    EXPECT_TRUE(text >= noted.saved_value && text <= noted.last_value) << text;
    return there;
}

void note_seen(journal& noted) {
    if (noted.may_prune || exists("private/flushed_data")) noted.seen = check_files(noted);
}

daemon_process start_again(journal& noted) {
    note_seen(noted);
    daemon_process daemon;
    EXPECT_TRUE(wait_until([&] {
        daemon = launch();
        return daemon.wait_ready() || daemon.count_in_log("already running") == 0;
    }));
    EXPECT_TRUE(daemon.wait_ready()) << daemon.log();
    const unique_fd client = connect_client(socket_kind::packets);
    EXPECT_EQ(ask(client.get(), "IA"), "1");
    if (noted.kills_only) {
        EXPECT_TRUE(noted.device_id.empty() || ask(client.get(), "GD") == noted.device_id);
        const std::string request = read_file("output/config_request");
        const bool known = !request.ends_with(std::string(20, '\0'));
        EXPECT_TRUE(known == is_configured() && known >= noted.configured) << known;
    }
    wait_children(daemon);
    std::istringstream log(daemon.log());
    for (std::string line; std::getline(log, line);) {
        const bool bad = line.find(" E ") != std::string::npos;
        EXPECT_TRUE(!bad || std::regex_search(line, described_at_start)) << line;
    }
    (void)check_files(noted);
    return daemon;
}

void check_restart(journal& noted) {
    daemon_process daemon = start_again(noted);
    check_service_and_stop(daemon, noted);
}

void check_service_and_stop(daemon_process& daemon, journal& noted) {
    const size_t errors_before = errors(daemon);
    install_report_key(noted);
    EXPECT_TRUE(carry_out({{}, {}, false, "NC"}, daemon, noted)) << "no answer";
    EXPECT_TRUE(is_configured());
    EXPECT_TRUE(carry_out({{100}, {100}, true, "FS"}, daemon, noted)) << "no answer";
    EXPECT_EQ(read_value("private/counters.txt", "counter"), noted.last_value);
    EXPECT_TRUE(carry_out({{}, {}, false, "FL"}, daemon, noted)) << "no answer";
    noted.acknowledges = true;  // a new file is begun
    const size_t reports = read_kept_data().reports.size();
    EXPECT_TRUE(carry_out({{200}, {}, false, "FL"}, daemon, noted)) << "no answer";
    EXPECT_EQ(errors(daemon), errors_before) << daemon.log();
    const kept_data data = read_kept_data();
    EXPECT_EQ(data.reports.size(), reports + 1);
    EXPECT_TRUE(data.reports.rbegin()->second.whole);
    EXPECT_EQ(data.reports.rbegin()->second.ids, std::vector{noted.last_id});

    EXPECT_EQ(daemon.stop(), 0) << daemon.log();
    (void)check_files(noted);
    for (const auto& entry : fs::directory_iterator("private")) {
        const std::string name = entry.path().filename();
        EXPECT_TRUE(std::regex_match(name, lasting_file)) << name << " is left";
    }
    EXPECT_TRUE(fs::is_empty("input"));
}

}  // namespace kivd
