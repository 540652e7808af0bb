#include <random>
#include <sstream>

#include "bench/daemon_process.h"
#include "config.pb.h"
#include "kivtool/config/config_build.h"
#include "kivtool/config/config_show.h"
#include "kivtool/sample_reports.h"
#include "support/outside_tools.h"
#include "support/scratch_directory.h"

namespace kivd {
namespace {

using namespace std::string_literals;

constexpr size_t largest_file = 204799;
constexpr size_t largest_package = 8 << 20;

class configurations : public report_files {
 protected:
    // Builds `output` of parts given as on the command line, with files in the directory; gives
    // what is wrong.
    std::string build(const std::vector<std::string>& arguments, const std::string& key = "",
                      bool no_lint = false) {
        std::vector<part_source> sources;
        for (const std::string& argument : arguments) {
            sources.push_back(read_part_argument(argument).value());
            sources.back().path = directory / sources.back().path;
        }
        config_build_options options = {output};
        if (!key.empty()) options.key_path = directory / key;
        options.no_lint = no_lint;
        std::ostringstream err;
        const int status = run_config_build(sources, options, err);
        std::string problem;
        std::istringstream lines(err.str());
        for (std::string line; std::getline(lines, line);) {
            if (line.find(": warning: ") == std::string::npos) problem += line + '\n';
        }
        EXPECT_EQ(status, problem.empty() ? 0 : 1) << err.str();
        return problem;
    }

    shown show(std::string_view bytes, const std::string& key = "") {
        const std::string path = write("shown", bytes);
        std::ostringstream out, err;
        std::optional<std::string> key_path;
        if (!key.empty()) key_path = directory / key;
        const int status = run_config_show(path, key_path, out, err);
        return {status, out.str(), err.str()};
    }

    const std::string output = directory / "config.bin";
    const google::protobuf::LogSilencer silencer;
};

std::string noise(size_t size) {
    std::mt19937 random;  // the same each time
    std::string bytes(size, '\0');
    for (char& byte : bytes) byte = static_cast<char>(random());
    return bytes;
}

TEST_F(configurations, are_what_the_programs_of_others_take_for_one) {
    write("filters", "event_filter { type: INCLUDE item { package: 'shop' name: '*' } } # all");
    write("once", "remove_reports: true");
    write("raw", "\0\xff\n"s);
    make_key(directory, "rsa");
    for (const std::string key : {"", "rsa"}) {
        SCOPED_TRACE(key);
        ASSERT_EQ(build({"kivd:FilterConfig=filters", "shop:a:b=raw", "kivd:RunActionsOnce=once"},
                        key.empty() ? "" : key + ".pem"),
                  "");
        const std::string bytes = read_file(output);
        EXPECT_EQ(bytes[0], key.empty() ? '\x12' : '\x0a');

        kiv::config::ConfigResponse file;
        ASSERT_TRUE(file.ParseFromString(bytes));
        write("signature", file.signature());
        write("package.gz", file.compressed_data());
        const std::string in_directory = "cd " + directory.string() + " && ";
        if (!key.empty()) {
            EXPECT_EQ(run(in_directory + "openssl dgst -sha1 -verify " + key +
                          ".pub.pem -signature signature package.gz")
                          .output,
                      "Verified OK\n");
        }
        EXPECT_EQ(
            run(in_directory + "gzip -dc package.gz | protoc --decode=kiv.config.ConfigPackage"
                               " -I " SOURCE_DIRECTORY "/proto config.proto")
                .output,
            "parts {\n  package: \"kivd\"\n  name: \"FilterConfig\"\n"
            "  payload: \"\\n\\r\\010\\001\\022\\t\\n\\004shop\\022\\001*\"\n}\n"
            "parts {\n  package: \"shop\"\n  name: \"a:b\"\n"
            "  payload: \"\\000\\377\\n\"\n}\n"
            "parts {\n  package: \"kivd\"\n  name: \"RunActionsOnce\"\n"
            "  payload: \"\\010\\001\"\n}\n");

        const shown seen = show(bytes);
        EXPECT_EQ("checksum: " + run("sha1sum <" + output).output.substr(0, 40),
                  seen.out.substr(0, 50));
        EXPECT_NE(seen.out.find(key.empty() ? "signed: no\n" : "signed: yes"), std::string::npos);
    }
}

TEST_F(configurations, of_the_documentation_are_built_and_shown) {
    const std::pair<const char*, std::string> texts[] = {{"filters", "FilterConfig"},
                                                         {"run-actions-once", "RunActionsOnce"}};
    for (const auto& [example, name] : texts) {
        write("text", doc_example("configuration.md", "text", example));
        ASSERT_EQ(build({"kivd:" + name + "=text"}), "");
        const std::string bytes = read_file(output), out = show(bytes).out;
        write("text", out.substr(out.find("\n    ")));  // what was shown can be built from
        ASSERT_EQ(build({"kivd:" + name + "=text"}), "");
        EXPECT_EQ(read_file(output), bytes) << out;
    }
    write("settings", "max_report_size: 200000 expire_counters_age: 86400");
    write("menu", "soup");
    ASSERT_EQ(build({"kivd:Settings=settings", "shop:menu=menu"}), "");
    const std::string example = doc_example("configuration.md", "hex", "configuration");
    const std::string package = doc_example("configuration.md", "hex", "package");
    for (const std::string& bytes : {read_file(output), example}) {
        EXPECT_EQ(gunzip_file(write("package.gz", bytes.substr(2))), package);
    }
    EXPECT_EQ(read_file(output).substr(2, 10), example.substr(2, 10));  // no time of making
    const shown seen = show(example);
    EXPECT_EQ(seen.status, 0) << seen.err;
    EXPECT_EQ(seen.out,
              "checksum: 300f63ad033400de88d96c031ffa910456e5c269\nsigned: no\nparts: 2\n"
              "part: kivd Settings, 8 bytes\n"
              "    max_report_size: 200000\n    expire_counters_age: 86400\n"
              "part: shop menu, 4 bytes\n    text: soup\n");
}

TEST_F(configurations, that_the_daemon_would_not_take_are_not_built) {
    write("a", "a");
    write("large", std::string(largest_package + 1, 'l'));
    make_key(directory, "key");
    // More than two primes, since those are found sooner.
    make_key(directory, "large_key",
             "RSA -pkeyopt rsa_keygen_bits:8208 -pkeyopt rsa_keygen_primes:5");
    make_key(directory, "ed", "ED25519");
    const std::string long_package(500, 'p');
    const struct {
        std::vector<std::string> parts;
        std::string problem;
        std::string key;
    } cases[] = {
        {{"kivd:_last_id=a"}, "Skipped part with the reserved name", ""},
        {{"p:n=a", "p:m=a", "p:n=a"}, "p:n: is given twice", ""},
        {{long_package + ":" + std::string(517, 'n') + "=a"}, "Too long name of part", ""},
        {{"p:n=none"}, "/none: cannot be opened: No such file or directory", ""},
        {{"p:n=large"}, "/large: has more than 8388608 bytes", ""},
        {{"p:n=a"}, "/key.pub.pem: holds no private key", "key.pub.pem"},
        {{"p:n=a"}, "/ed.pem: cannot sign", "ed.pem"},
        {{"p:n=a"}, "/large_key.pem: makes signatures of 1026 bytes", "large_key.pem"},
    };
    write("config.bin", "as before");
    for (const auto& bad : cases) {
        SCOPED_TRACE(bad.problem);
        const std::string problem = build(bad.parts, bad.key);
        EXPECT_NE(problem.find(bad.problem), std::string::npos) << problem;
        EXPECT_EQ(read_file(output), "as before");
    }
    EXPECT_EQ(build({long_package + ":" + std::string(516, 'n') + "=a"}), "");
}

TEST_F(configurations, appear_whole_or_not_at_all) {
    const std::string before = noise(3000);
    const std::string path = write("config.bin", before);
    write("part", noise(4000));
    EXPECT_EXIT(
        {
            limit_file_size(3500);
            exit(build({"p:n=part"}, "", true).find("cannot be written: File too large") ==
                 std::string::npos);
        },
        testing::ExitedWithCode(0), "");
    EXPECT_EQ(read_file(path), before);
    EXPECT_EQ(std::distance(std::filesystem::directory_iterator(directory), {}), 2);

    std::filesystem::remove(path);
    std::filesystem::create_directory(path);
    EXPECT_NE(build({"p:n=part"}).find("is no regular file"), std::string::npos);
}

TEST_F(configurations, are_made_and_shown_from_the_command_line) {
    make_key(directory, "key");
    make_key(directory, "other");
    write("part", "payload");
    write("bad", "\nmax_report_size: 6000000");
    write("unknown", "max_report_size: 1\nmax_report: 1");
    write("incomplete", "\n\n counter_filter { }");
    write("filters", "event_filter { type: EXCLUDE }");
    write("twice",
          "event_filter { type: EXCLUDE\n item { package: 'a' name: '*' }\n"
          " item { package: 'a' name: 'x' } }");
    write("noise", noise(largest_file));
    const struct {
        std::string arguments;
        int status;
        std::string output;  // part of it
    } cases[] = {
        {"config build -o c.bin --sign key.pem p:n=part kivd:Settings=/dev/null", 0, ""},
        {"config show --key key.pub.pem c.bin", 0, "signature: valid\nparts: 2\npart: p n, 7 byte"},
        {"config show --key other.pub.pem c.bin", 1, "signature: NOT valid\n"},
        {"config show --key key.pem c.bin", 1, "key.pem: holds no public key"},
        {"config show noise", 1, "noise: is no configuration: the byte at its start is 0x5C"},
        {"config show /dev/null", 1, "the file is empty"},
        {"config show c.bin >/dev/full", 1, "the output could not be written"},
        {"config build -o none/c.bin p:n=part", 1, "none/c.bin: cannot be written: No such file"},
        {"config build -o c.bin kivd:Settings=bad", 1, "bad: error: kivd:Settings: the daemon"},
        {"config build -o bad.bin --no-lint kivd:Settings=bad kivd:_last_id=part", 0, ""},
        {"config build -o c.bin kivd:Settings=unknown", 1, "unknown:2:11: "},
        {"config build -o c.bin kivd:FilterConfig=incomplete", 1,
         "incomplete:3:2: kiv.config.Filter lacks \"type\""},
        {"config lint bad.bin", 1, "bad.bin: error: the daemon logs "},
        {"config lint c.bin kivd:FilterConfig=filters", 0,
         "c.bin: warning: there is no filter of ev"},
        {"config lint kivd:FilterConfig=filters kivd:Settings=bad", 1, "bad: error: kivd:Settings"},
        {"config lint kivd:FilterConfig=twice", 1,
         "twice: error: kivd:FilterConfig: the daemon logs \"kivd-filter: Failed adding probe <a>"},
        {"config lint kivd:FilterConfig=filters p:n=noise", 1,
         "configuration: error: a configuration has at most 204799 bytes"},
        {"config lint part=none", 1, "part=none: cannot be opened"},
        {"config build -o c.bin", 2, "required"},
        {"config build -o c.bin p=part", 2, "p=part is not PACKAGE:NAME=FILE"},
        {"config build -o c.bin p:=part", 2, "is not"},
        {"report --key key.pem c.bin", 1, "c.bin: "},
        {"report - <c.bin", 1, "-: stopped at byte"},
        {"report jsonl", 2, "required"},
    };
    for (const auto& line : cases) {
        SCOPED_TRACE(line.arguments);
        const outcome told =
            run("cd " + directory.string() + " && " KIVTOOL_PATH " " + line.arguments);
        EXPECT_EQ(told.status, line.status);
        EXPECT_NE(told.output.find(line.output), std::string::npos) << told.output;
    }
}

}  // namespace
}  // namespace kivd
