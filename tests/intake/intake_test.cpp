#include "intake/intake.h"

#include <sys/stat.h>

#include <algorithm>
#include <map>

#include "bench/daemon_process.h"
#include "config/config_parts.h"
#include "config/limits.h"
#include "report.pb.h"
#include "report/state_file.h"
#include "security/key_paths.h"
#include "settings.pb.h"
#include "support/config_package.h"
#include "support/scratch_directory.h"
#include "util/paths.h"

namespace kivd {
namespace {

using refusals = std::vector<std::string>;
constexpr char unpack_failure[] = "E kivd-conf: Failed to unpack configuration";
constexpr char bad_length[] = "E kivd-conf: Corrupt file - bad field length";
constexpr char read_failure[] = "E kivd-conf: Failed to read configuration";
constexpr char parse_failure[] = "E kivd-conf: Failed to parse configuration";
constexpr char verify_failure[] = "E kivd-conf: Failed to verify configuration";

std::string extract_failure(const std::string& field) {
    return "E kivd-conf: Failed to extract to private/new_config." + field;
}

class intake : public scratch_directory {
 protected:
    bool take(const std::string& file) {
        (void)take_log();
        write_file("input/config", file);
        const bool taken = take_new_configuration();
        EXPECT_TRUE(fs::is_empty("input"));
        for (const char* name : {"private/new_config.gz", "private/new_config.sig"}) {
            EXPECT_FALSE(exists(name)) << name;
        }
        return taken;
    }
    // All that a configuration leaves behind, and the checksum in memory.
    std::map<std::string, std::string> in_force() {
        std::map<std::string, std::string> files;
        for (const auto& entry : fs::directory_iterator("private")) {
            files[entry.path()] = read_file(entry.path());
        }
        files["checksum"] = text_of_checksum(get_config_checksum()).data();
        return files;
    }
};

// What a client that asks for the part gets.
std::string part(const char* package, const char* name) {
    const auto bytes = read_whole_fd(get_config_fd(package, name));
    return bytes ? std::string(bytes->data.get(), bytes->data.get() + bytes->size) : "none";
}

TEST_F(intake, parts_come_and_go_but_ids_are_never_given_out_twice) {
    const std::string long_payload(5000, '\0');
    ASSERT_TRUE(take(config_file({{"b", "y", "1"}, {"a", "x", long_payload}, {"b", "y", "2"}})));
    EXPECT_EQ(part("b", "y"), "2");
    EXPECT_EQ(part("a", "x"), long_payload);
    EXPECT_EQ(read_file("private/config_list.txt"),
              "a\0x\0002\0001\0\0\nb\0y\0001\0001\0\0\nkivd\0_last_id\0002\0000\0\0\n"s);
    for (const int round : {1, 2}) {  // as taken, and as loaded
        SCOPED_TRACE(round);
        ASSERT_TRUE(take(config_file({{"c", "z", ""}, {"kivd", "_last_id", "no part"}})));
        EXPECT_EQ(part("c", "z"), "");
        for (const char* name : {"x", "y"})
            EXPECT_EQ(part("a", name) + part("b", name), "nonenone");
        EXPECT_FALSE(exists("private/conf_1.bin") || exists("private/conf_2.bin"));
        EXPECT_TRUE(exists("private/conf_3.bin"));
        restart();
    }
    ASSERT_TRUE(take(config_file({{"b", "y", "again"}, {"..", "../../x", "4"}})));
    EXPECT_EQ(read_file("private/conf_1.bin") + read_file("private/conf_4.bin"), "again4");
    EXPECT_FALSE(exists("private/conf_3.bin"));

    ASSERT_TRUE(take(config_file(std::vector<config_part>())));  // nothing is a configuration too
    EXPECT_EQ(part("b", "y"), "none");
    ASSERT_TRUE(take(config_file(pack({{"a", "x", "as it is"}}))));  // need not be compressed
    EXPECT_EQ(part("a", "x"), "as it is");

    // Those that are gone lose their places when there are no others, but never their ids.
    std::string list = "kivd\0_last_id\00019998\0000\0\0\n"s;
    for (int id = 1; id < 19999; ++id) {
        const std::string text = std::to_string(id);
        list += "x\0"s + text + '\0' + text + "\0000\0\0\n"s;
    }
    write_file("private/config_list.txt", list);
    restart();
    ASSERT_TRUE(take(config_file({{"x", "7", "old"}, {"z", "8", "new"}})));
    EXPECT_EQ(read_file("private/config_list.txt").size(), list.size() + sizeof "z 8 19999 1  ");
    ASSERT_TRUE(take(config_file({{"x", "7", "old"}, {"z", "9", "new"}})));
    EXPECT_EQ(
        read_file("private/config_list.txt"),
        "kivd\0_last_id\00020000\0000\0\0\nx\0007\0007\0001\0\0\nz\0009\00020000\0001\0\0\n"s);
}

TEST_F(intake, a_damaged_list_gives_no_part_the_file_of_another) {
    for (const std::string& counter :
         {""s, "kivd\0_last_id\0-5\0000\0\0\n"s, "kivd\0_last_id\0x\0001\0\0\n"s}) {
        write_file("private/config_list.txt", "a\0x\0007\0001\0\0\nb\0y\0z\0\0\n"s + counter);
        restart();
        ASSERT_TRUE(take(config_file({{"a", "x", "old"}, {"c", "z", "new"}})));
        EXPECT_EQ(read_file("private/conf_7.bin") + read_file("private/conf_8.bin"), "oldnew");
        EXPECT_EQ(part("kivd", "_last_id"), "none");
    }
    // Out of order, and two with one file.
    write_file("private/config_list.txt",
               "b\0y\0008\0001\0\0\na\0x\0007\0001\0\0\nc\0z\0007\0001\0\0\n"s);
    restart();
    EXPECT_EQ(part("a", "x") + part("b", "y") + part("c", "z"), "nonenewnone");

    write_file("private/config_list.txt", "kivd\0_last_id\0002147483647\0000\0\0\n"s);
    restart();
    ASSERT_TRUE(take(config_file({{"c", "z", "one too many"}})));
    EXPECT_EQ(part("c", "z"), "none");
}

TEST_F(intake, the_request_names_the_device_and_the_configuration) {
    const std::string file = doc_example("configuration.md", "hex", "configuration");
    write_file("input/other", "");
    ASSERT_TRUE(take(file));
    EXPECT_EQ(read_file("private/config_list.txt"),
              doc_example("files.md", "hex", "config-list-file"));
    EXPECT_TRUE(read_file("output/config_request")
                    .ends_with(doc_example("report-format.md", "hex", "config-request-end")));
    write_file("config", file);
    const std::string digits = openssl("dgst -sha1 -r config").substr(0, 40);
    EXPECT_EQ(text_of_checksum(get_config_checksum()).data(), digits);
    EXPECT_NE(read_file("private/kivd.state").find("config-checksum: " + digits + "\n"),
              std::string::npos);

    kiv::config::ConfigRequest request;
    ASSERT_TRUE(request.ParseFromString(read_file("output/config_request")));
    EXPECT_EQ(request.header().product_id(), "P1");
    EXPECT_EQ(request.header().config_checksum(), std::string(40, '0'));  // so far
    const config_checksum current = get_config_checksum();
    EXPECT_EQ(request.current_config(), std::string(current.begin(), current.end()));
}

TEST_F(intake, whatever_is_wrong_leaves_the_configuration_in_force_untouched) {
    ASSERT_TRUE(take(config_file({{"a", "x", "kept"}})));
    const auto before = in_force();
    const std::string good = gzip(pack({{"a", "x", "new"}}));
    std::string flipped = good;
    flipped[flipped.size() - 6] ^= 1;  // in the checksum
    const std::string long_name(1100, 'n');
    std::string two_members = gzip("") + good.substr(0, good.size() - 1);

    const std::pair<std::string, refusals> cases[] = {
        {"", {unpack_failure}},
        {"\x0a", {bad_length, unpack_failure}},
        {"\x12", {bad_length, unpack_failure}},
        {"\x22\x01x", {unpack_failure}},
        {"\x0a\x01x", {unpack_failure}},
        {"\x0a\x01xx", {unpack_failure}},
        {"\x12\x80\x80\x80\x80\x80\x01", {bad_length, unpack_failure}},
        {"\x12\x03xy", {extract_failure("gz"), unpack_failure}},
        {"\x12\x04xy", {bad_length, unpack_failure}},
        {"\x0a\x80\x80\x80\x80\x08xy", {extract_failure("sig"), unpack_failure}},
        {"\x12\xff\xff\xff\xff\x0fxy", {extract_failure("gz"), unpack_failure}},
        {std::string(204800, '\x12'), {unpack_failure}},
        {config_file("\x1f\x8b\x08"), {read_failure}},
        {config_file(two_members), {read_failure}},
        {config_file(flipped), {read_failure}},
        {config_file(gzip(std::string((8 << 20) + 1, '\0'))), {read_failure}},
        {config_file(gzip(std::string(8 << 20, '\0'))),
         {"E kivd-conf: Too many fields in the configuration", parse_failure}},
        {config_file(gzip(pack(std::vector<config_part>(20000, {"p", "n", ""})))),
         {"E kivd-conf: Too many parts: 20000, of at most 19999", parse_failure}},
        {config_file({{"p", long_name, ""}}),
         {"E kivd-conf: Too long name of part [p:" + long_name + "]", parse_failure}},
        {config_file({own_part<kiv::config::FilterConfig>(
             "FilterConfig",
             "event_filter { type: INCLUDE item { package: 'a' name: '" + long_name + "' } }")}),
         {"E kivd-filter: Too long filter item <a><" + long_name + ">", parse_failure}},
        {config_file("not a package"), {parse_failure}},
        {config_file(gzip("\x0a\x03\x0a\x01p")), {parse_failure}},
    };
    for (const auto& [file, expected] : cases) {
        SCOPED_TRACE(testing::Message() << file.size() << " bytes: " << file.substr(0, 8));
        EXPECT_FALSE(take(file));
        EXPECT_EQ(take_log(), expected);
        EXPECT_EQ(in_force(), before);
    }
    EXPECT_FALSE(take_new_configuration());  // none is there
    EXPECT_EQ(mkfifo("input/config", 0600), 0);
    EXPECT_FALSE(take_new_configuration());  // nor does it wait for one
    EXPECT_EQ(take_log(), lines({unpack_failure}));
    fs::create_directory("input/config");
    EXPECT_FALSE(take_new_configuration());
    EXPECT_EQ(take_log(), lines({"W kivd-conf: Failed to delete input/config."}));
    fs::remove("input/config");

    // The largest file there may be, in spite of what an intake that was killed has left.
    for (const char* field : {"gz", "sig"}) {
        fs::create_symlink("/dev/full", "private/new_config."s + field);
    }
    const std::string whole = config_file(good);
    EXPECT_TRUE(take(whole + std::string(204799 - whole.size(), 'x')));
    EXPECT_EQ(part("a", "x"), "new");
}

// Others may write in input/ and output/.
TEST_F(intake, what_lies_at_a_name_is_neither_followed_nor_waited_for) {
    const std::string file =
        config_file({own_part<kivd::Settings>("Settings", "permanently_disable: true")});
    write_file("precious", "x");
    for (const bool is_pipe : {false, true}) {
        for (const char* name : {paths::config_file, paths::new_config_file, paths::config_request,
                                 paths::new_config_request, paths::disable_marker}) {
            fs::remove(name);
            if (!is_pipe) fs::create_symlink("../precious", name);
            EXPECT_EQ(mkfifo(name, 0600), is_pipe ? 0 : -1);
        }
        replace_config_file(file);
        EXPECT_EQ(read_file("input/config"), file);
        EXPECT_TRUE(take_new_configuration());
        for (const char* name : {paths::config_request, paths::disable_marker}) {
            EXPECT_TRUE(fs::is_regular_file(fs::symlink_status(name))) << name;
        }
        EXPECT_FALSE(exists(paths::new_config_request));
    }
    EXPECT_EQ(read_file("precious"), "x");
}

TEST_F(intake, with_a_key_only_what_it_has_signed_is_taken) {
    make_keys("config");
    make_keys("other");
    set_config_key_dir("./");
    const std::string data = gzip(pack({{"a", "x", "signed"}}));
    const std::string file = config_file(data, sign(data, "config"));
    const auto before = in_force();
    const std::string signatures[] = {std::string(1, '\0'), std::string(1025, 'x'),
                                      sign(data, "other"), sign(data + ".", "config")};
    for (const std::string& signature : signatures) {
        EXPECT_FALSE(take(config_file(data, signature)));
        EXPECT_EQ(take_log(), lines({verify_failure}));
    }
    fs::create_directory("loop");
    fs::create_symlink("kiv_config.pem", "loop/kiv_config.pem");  // there, but it cannot be read
    set_config_key_dir("loop/");
    EXPECT_FALSE(take(file));
    set_config_key_dir("./");
    // What an intake that was killed left behind is not this file's.
    write_file("private/new_config.sig", sign(data, "config"));
    EXPECT_FALSE(take(config_file(data)));
    EXPECT_EQ(take_log(), lines({"E kivd/crypto: Failed to open signature file.", verify_failure}));
    EXPECT_EQ(in_force(), before);

    EXPECT_TRUE(take(file));
    write_file("kiv_config.pem", "no key");
    EXPECT_FALSE(take(file));
    EXPECT_EQ(take_log(), lines({"E kivd/crypto: Failed to load public key.", verify_failure}));
    clear_config_key_path();
    EXPECT_TRUE(take(config_file(data, "unchecked")));
}

TEST_F(intake, settings_come_and_go_with_their_part) {
    using values = std::array<uint32_t, 4>;  // report, output, counters, static data
    const auto in_effect = [] {
        const limits& l = get_limits();
        return values{l.max_report_size, l.max_output_dir_size, l.expire_counters_age,
                      l.expire_sdata_age};
    };
    const std::pair<const char*, values> cases[] = {
        {"max_report_size: 5000000 expire_sdata_age: 0", {5000000, 5242880, 77, 0}},
        {"max_output_dir_size: 409600 expire_counters_age: 9", {409600, 409600, 9, 2592000}},
        {"max_report_size: 6000000 expire_counters_age: 9", {409600, 5242880, 9, 2592000}},
        {"max_report_size: 4294967295 max_output_dir_size: 4294967295",
         {4294967295, 4294967295, 77, 2592000}},
        {"permanently_disable: false", {409600, 5242880, 77, 2592000}},
    };
    get_base_limits().expire_counters_age = 77;
    for (const auto& [text, expected] : cases) {
        ASSERT_TRUE(take(config_file({own_part<Settings>("Settings", text)})));
        const std::string clash =
            "E kivd-settings: Bad settings found in configuration file, report_max_size "
            "(6000000) > output_dir_max_size (5242880). Default values (409600)(5242880) "
            "will be used";
        const lines log = take_log();
        EXPECT_EQ(std::ranges::count(log, clash), expected == cases[2].second) << text;
        EXPECT_EQ(in_effect(), expected) << text;
        restart();  // remembered
        get_base_limits().expire_counters_age = 77;
        EXPECT_EQ(in_effect(), expected) << text;
    }
    ASSERT_TRUE(take(config_file({{"kivd", "Settings", "\xff"}})));
    EXPECT_EQ(in_effect(), cases[4].second);
}

}  // namespace
}  // namespace kivd
