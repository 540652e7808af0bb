#include "diag/diag_store.h"

#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include "bench/daemon_process.h"
#include "diag/file_export.h"
#include "report.pb.h"
#include "support/scratch_directory.h"
#include "system_logging.pb.h"
#include "util/clock.h"

namespace kivd {
namespace {

using kiv::system_logging::LogMessage;

class diag_store : public scratch_directory {
 protected:
    ~diag_store() override { diag_wait_for_compressor(); }
};

std::string log_message(const std::string& tag, const std::string& text = "") {
    LogMessage message;
    message.set_log(kiv::system_logging::MAIN);
    message.set_tag(tag);
    if (!text.empty()) message.set_msg(text);
    return message.SerializeAsString();
}

// A message with a list in a field in a list, and so on, `depth` levels below itself.
std::string nested_message(int depth) {
    std::string inner;
    for (int level = depth; level > 0; --level) {
        const char key = level == 1 ? '\x4a' : level % 2 == 0 ? '\x0a' : '\x22';
        std::string size;
        size_t rest = inner.size();
        for (; rest > 127; rest >>= 7) size += static_cast<char>(rest | 128);
        inner = key + (size + static_cast<char>(rest)) + inner;
    }
    return log_message("am_crash") + inner;
}

void add(const std::string& package, const std::string& name, const std::string& payload) {
    diag_add_event(package.c_str(), name.c_str(), payload);
}

constexpr char log_package[] = "kiv.system_logging";

// What is in the file with that number, as a client gets it.
std::string file(int number) {
    const unique_fd fd = open_exported_file("750", std::to_string(number).c_str());
    return fd.ok() ? read_file("/proc/self/fd/" + std::to_string(fd.get())) : "none";
}

std::vector<std::string> stored() {
    kiv::Report records;
    EXPECT_TRUE(records.ParsePartialFromString(read_file("private/qz/qz_1")));
    for (const char* path : {"private/qz", "private/qz/qz_1"}) {
        EXPECT_EQ(fs::status(path).permissions(), fs::perms::owner_all) << path;
    }
    std::vector<std::string> names;
    for (const auto& event : records.events()) names.push_back(event.package() + event.name());
    return names;
}

std::vector<std::string> names_there() {
    std::vector<std::string> names;
    for (const auto& entry : fs::directory_iterator("private/qz")) {
        names.push_back(entry.path().filename());
    }
    std::ranges::sort(names);
    return names;
}

TEST_F(diag_store, keeps_the_few_kinds_of_events_that_it_is_for) {
    add(log_package, "LogMessage", log_message("am_crash"));
    EXPECT_FALSE(exists("private/qz"));  // off

    diag_set_active(1);
    const struct {
        std::string package, name, payload;
        bool kept;
    } cases[] = {
        {"com.example.devicemonitor.powerstat", "ShutDown", "x", true},
        {"devicemonitor.powerstat", "BootComplete", "", true},
        {"devicemonitor.powerstat", "Shutdown", "", false},
        {"devicemonitor.powerstat.x", "ShutDown", "", false},
        {"powerstat", "ShutDown", "", false},
        {log_package, "LogMessage", log_message("am_crash"), true},
        {log_package, "LogMessage", log_message("am_anr", "text"), true},
        {log_package, "LogMessage", log_message("RILJ", "[1]< LAST_CALL_FAIL_CAUSE 16"), true},
        {log_package, "LogMessage", log_message("RILJ", "< OTHER"), false},
        {log_package, "LogMessage", log_message("RILJ"), false},
        {log_package, "LogMessage", log_message("am_crash2"), false},
        {log_package, "LogMessage", "", true},
        {log_package, "LogMessage", nested_message(64), true},
    };
    std::vector<std::string> expected;
    for (const auto& each : cases) {
        add(each.package, each.name, each.payload);
        if (each.kept) expected.push_back(each.package + each.name);
        EXPECT_EQ(stored(), expected) << each.package << each.payload;
    }
    EXPECT_EQ(take_log(), lines());
    LogMessage no_tag;
    no_tag.set_log(kiv::system_logging::MAIN);
    for (const std::string& payload :
         {nested_message(65), nested_message(9000), no_tag.SerializeAsString(), "\x3a\x01y"s,
          log_message("am_crash") + "\x80"s, log_message("am_crash") + "\x4a",
          log_message("am_crash") + "\x4a\x7fx"}) {
        add(log_package, "LogMessage", payload);
        EXPECT_EQ(take_log(), lines({"E kivd-qz: Failed to unpack protobuf LogMessage"}));
    }
    EXPECT_EQ(stored(), expected);

    EXPECT_TRUE(diag_wants_probe(log_package, "LogMessage"));
    EXPECT_FALSE(diag_wants_probe(log_package, "Other"));
    EXPECT_EQ(diag_space_reserve(), 327680U);
    diag_set_active(2);
    EXPECT_FALSE(diag_wants_probe(log_package, "LogMessage"));
    EXPECT_EQ(diag_space_reserve(), 327680U);
    diag_set_active(0);
    EXPECT_FALSE(exists("private/qz"));
    EXPECT_EQ(diag_space_reserve(), 0U);
}

TEST_F(diag_store, full_files_are_compressed_and_only_the_newest_stay) {
    diag_set_active(1);
    write_file("private/qz/notes.txt", "");
    enable_test_mode();
    add(log_package, "LogMessage", log_message("am_anr"));
    EXPECT_EQ(file(1), doc_example("files.md", "hex", "diagnostics-file"));
    const std::string event = log_message("am_crash", std::string(30000, 'x'));
    std::string full[7];
    for (int number = 1; number <= 6; ++number) {
        while (file(number).size() < 204800) add(log_package, "LogMessage", event);
        full[number] = file(number);
        add(log_package, "LogMessage", event);
        if (number % 2 != 0) continue;  // another one is full at once
        diag_wait_for_compressor();
        EXPECT_EQ(waitpid(-1, nullptr, WNOHANG), -1);  // nobody else is at work
        for (const int ready : {number - 1, number}) {
            EXPECT_FALSE(exists("private/qz/qz_" + std::to_string(ready)));
            write_file("compressed", file(ready));
            EXPECT_EQ(gunzip_file("compressed"), full[ready]) << ready;
        }
    }
    EXPECT_EQ(names_there(),
              (std::vector<std::string>{"notes.txt", "qy_4", "qy_5", "qy_6", "qz_7"}));
    const lines log = take_log();
    for (const char* line :
         {"I kivd-qz: Max file size reached, opening new file", "I kivd-qz: Compressing Report...",
          "W kivd-qz: Unexpected file in private/qz/ directory: notes.txt"}) {
        EXPECT_NE(std::ranges::find(log, line), log.end()) << line;
    }
    fs::create_directory("private/qz/directory");
    diag_set_active(0);
    EXPECT_EQ(take_log(),
              lines({"E kivd-qz: Failed to delete private/qz/directory, <Is a directory>",
                     "E kivd-qz: Failed to remove Lumora Diagnostics output directory: "
                     "Directory not empty"}));
}

TEST_F(diag_store, clients_walk_the_files_by_number) {
    const auto next = [](const char* number) { return next_exported_file("750", number); };
    EXPECT_EQ(next("0"), -1);  // before any was there
    fs::create_directory("private/qz");
    EXPECT_EQ(next("0"), -1);
    for (const char* name : {"qy_4", "qz_5", "qy_5", "qz_6"}) {
        write_file("private/qz/"s + name, name);
    }
    const std::pair<const char*, int> steps[] = {
        {"0", 4},           {"-1", 4},           {"4", 5}, {"5", 6}, {"6", -1}, {"9", -1},
        {"2147483647", -1}, {"99999999999", -1}, {"x", 4},
    };
    for (const auto& [number, expected] : steps) EXPECT_EQ(next(number), expected) << number;
    EXPECT_EQ(file(4) + file(5) + file(6) + file(7), "qy_4qy_5qz_6none");
    EXPECT_EQ(fcntl(open_exported_file("750", "4").get(), F_GETFL) & O_ACCMODE, O_RDONLY);
    EXPECT_EQ(next_exported_file("751", "0"), -1);
    EXPECT_FALSE(open_exported_file("751", "4").ok());
    EXPECT_EQ(take_log(), lines());
    EXPECT_EQ(next_exported_file("750", nullptr), -1);
    EXPECT_FALSE(open_exported_file(nullptr, nullptr).ok());
    EXPECT_EQ(take_log(), lines({"E kivd-fu: File iterator next, null parameters found.",
                                 "E kivd-fu: File get, null parameters found."}));
}

}  // namespace
}  // namespace kivd
