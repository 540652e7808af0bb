#include "reliability/torture/promises.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/file.h>

#include <algorithm>
#include <map>
#include <regex>
#include <sstream>
#include <utility>

#include "end_to_end/daemon_test.h"
#include "kivtool/report/report_reader.h"
#include "toolkit/keys.h"

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

// The events in a file up to the first that is torn or spoilt; the daemon's own don't count.
struct records {
    std::vector<event_id> ids;
    bool whole = false;
    bool sealed = false;  // and opened
};

records read_records(const std::string& path) {
    static const unique_pkey key = read_key("../../report.key", key_half::private_half);
    records found;
    report_reader reader(path, key.get());
    while (const report_record* const record = reader.next()) {
        if (record->field->name() != "events") continue;
        const auto& event = get<kiv::Event>(*record);
        const auto id = find_event_id(event.package());
        if (id && !is_intact(event.package(), event.payload())) return found;
        if (id) found.ids.push_back(*id);
    }
    found.whole = reader.problem().empty();
    found.sealed = !read_file(path).starts_with("\x1f\x8b");
    return found;
}

std::map<int, records> read_numbered(const char* directory, const std::string& beginning) {
    std::map<int, records> files;
    std::error_code none;
    for (const auto& entry : fs::directory_iterator(directory, none)) {
        const std::string name = entry.path().filename();
        if (!name.starts_with(beginning)) continue;
        files[std::stoi(name.substr(beginning.size()))] = read_records(entry.path());
    }
    return files;
}

std::map<int, records> read_reports() { return read_numbered("output", "kiv_"); }

// The last field of the record of that name in a list file, 0 when there is none.
int64_t read_value(const std::string& path, const std::string& name) {
    std::istringstream file(read_file(path));
    for (std::string record; std::getline(file, record);) {
        if (record.find('\0' + name + '\0') == std::string::npos) continue;
        record.erase(record.find_last_not_of('\0') + 1);
        return std::stoll(record.substr(record.rfind('\0') + 1));
    }
    return 0;
}

std::vector<event_id> all_ids(const std::map<int, records>& files) {
    std::vector<event_id> ids;
    for (const auto& [number, file] : files)
        ids.insert(ids.end(), file.ids.begin(), file.ids.end());
    return ids;
}

// Each was sent, is there once and in its order; those that are `wanted` are there.
void check_ids(const std::vector<event_id>& ids, const std::set<event_id>& wanted,
               std::set<event_id> there, const journal& noted) {
    std::map<size_t, uint64_t> last;
    for (const event_id& id : ids) {
        EXPECT_TRUE(noted.sent.contains(id)) << id.client << "." << id.number << " was never sent";
        const auto [before, is_first] = last.try_emplace(id.client, id.number);
        EXPECT_TRUE(is_first || before->second < id.number) << id.client << "." << id.number;
        before->second = id.number;
    }
    there.insert(ids.begin(), ids.end());
    for (const event_id& id : wanted) {
        EXPECT_TRUE(there.contains(id)) << id.client << "." << id.number << " is lost";
    }
}

// A compactor that is killed when its report is there leaves what it has made it of.
bool is_reported(const std::vector<event_id>& flushed, const std::vector<event_id>& reported) {
    const auto there = [&](const event_id& id) { return std::ranges::count(reported, id) > 0; };
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

bool carry_out(const std::string& words, const daemon_process& daemon, journal& noted) {
    if (words.ends_with("FL") || words.ends_with("NC")) note_seen(noted);
    const size_t errors_before = errors(daemon);
    const unique_fd client = connect_client(socket_kind::packets);
    std::set<event_id> events;
    std::set<event_id> logged;
    const auto send = [&](const std::string& word) {
        if (isupper(word[0])) return send_text(client.get(), word);
        const bool is_logged = word[0] == 'l';
        const event_id id = {first_client, ++noted.last_number};
        const size_t size = std::stoul(word.substr(1));
        (is_logged ? logged : events).insert(id);
        noted.sent.insert(id);
        const std::string package = event_package(id, size) + (is_logged ? diag_package_end : "");
        return send_text(client.get(),
                         request_of({"EV", package, event_name, payload_of(id, size)}));
    };
    std::istringstream all(words);
    for (std::string word; all >> word;) {
        const std::string value = std::to_string(noted.last_value += word == "values");
        const bool is_sent = word == "values"
                                 ? send("CS p counter " + value) && send("SD p static " + value)
                                 : send(word == "NC" ? "WC " + read_file("../../config") : word);
        if (!is_sent) return false;
    }
    const bool refused = words.ends_with("NC") && ask(client.get(), "NC") == "0";
    EXPECT_FALSE(refused && noted.kills_only);
    const std::string device_id = ask(client.get(), "GD");
    if (ask(client.get(), "IA") != "1") return false;
    wait_children(daemon);
    if (errors(daemon) != errors_before || !noted.acknowledges) return true;
    if (errors(daemon) == 0) noted.device_id = device_id;
    if (noted.configured) noted.logged.insert(logged.begin(), logged.end());
    noted.kept.merge(events);
    noted.kept.merge(logged);
    if (words.ends_with("FS")) noted.saved_value = noted.last_value;
    if (words.ends_with("NC")) noted.configured = is_configured();
    return true;
}

void install_report_key(journal& noted) {
    if (exists("../keys/kiv_report.pem")) return;
    fs::copy_file("../../kiv_report.pem", "../keys/kiv_report.pem");
    noted.plain_reports = read_reports().size();
}

std::set<event_id> check_files(const journal& noted) {
    const std::map<int, records> reports = read_reports();
    int last = noted.may_prune && !reports.empty() ? reports.begin()->first - 1 : 0;
    for (const auto& [number, report] : reports) {
        EXPECT_TRUE(report.whole) << "kiv_" << number;
        EXPECT_EQ(number, ++last);
        const bool was_plain = std::cmp_less_equal(number, noted.plain_reports);
        EXPECT_TRUE(report.sealed || was_plain) << "kiv_" << number << " is readable";
    }
    std::vector<event_id> ids = all_ids(reports);
    std::map<int, records> unfinished = {{1, read_records("private/events")}};
    const records flushed = read_records("private/flushed_data");
    if (!is_reported(flushed.ids, ids)) unfinished[0] = flushed;
    std::ranges::copy(all_ids(unfinished), std::back_inserter(ids));
    check_ids(ids, noted.kept, noted.seen, noted);
    std::map<int, records> diagnostics = read_numbered("private/qz", "qy_");
    diagnostics.merge(read_numbered("private/qz", "qz_"));
    check_ids(all_ids(diagnostics), noted.logged, {}, noted);
    for (const auto& [file, name] :
         {std::pair("private/counters.txt", "counter"), {"private/sdata.txt", "static"}}) {
        const int64_t value = read_value(file, name);
        EXPECT_TRUE(value >= noted.saved_value && value <= noted.last_value) << value;
    }
    std::set<event_id> there = noted.seen;
    there.insert(ids.begin(), ids.end());
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
    EXPECT_TRUE(noted.device_id.empty() || ask(client.get(), "GD") == noted.device_id);
    const std::string request = read_file("output/config_request");
    const bool known = !request.ends_with(std::string(20, '\0'));
    EXPECT_TRUE(known == is_configured() && known >= noted.configured) << known;
    wait_children(daemon);
    std::istringstream log(daemon.log());
    for (std::string line; std::getline(log, line);) {
        const bool bad = line.find(" E ") != std::string::npos;
        EXPECT_TRUE(!bad || std::regex_search(line, described_at_start)) << line;
    }
    (void)check_files(noted);
    return daemon;
}

void check_service_and_stop(daemon_process& daemon, journal& noted) {
    const size_t errors_before = errors(daemon);
    install_report_key(noted);
    EXPECT_TRUE(carry_out("NC", daemon, noted)) << "no answer";
    EXPECT_TRUE(is_configured());
    EXPECT_TRUE(carry_out("e100 l100 values FS", daemon, noted)) << "no answer";
    EXPECT_EQ(read_value("private/counters.txt", "counter"), noted.last_value);
    EXPECT_TRUE(carry_out("FL", daemon, noted)) << "no answer";
    noted.acknowledges = true;  // a new file is begun
    const size_t reports = read_reports().size();
    EXPECT_TRUE(carry_out("e200 FL", daemon, noted)) << "no answer";
    EXPECT_EQ(errors(daemon), errors_before) << daemon.log();
    const std::map<int, records> now = read_reports();
    EXPECT_EQ(now.size(), reports + 1);
    const std::vector last = {event_id{first_client, noted.last_number}};
    EXPECT_TRUE(!now.empty() && now.rbegin()->second.whole && now.rbegin()->second.ids == last);

    EXPECT_EQ(daemon.stop(), 0) << daemon.log();
    (void)check_files(noted);
    for (const auto& entry : fs::directory_iterator("private")) {
        const std::string name = entry.path().filename();
        EXPECT_TRUE(std::regex_match(name, lasting_file)) << name << " is left";
    }
    EXPECT_TRUE(fs::is_empty("input"));
}

}  // namespace kivd
