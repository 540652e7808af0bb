#include "kivtool/report/report_command.h"

#include "kivtool/sample_reports.h"
#include "support/outside_tools.h"
#include "support/scratch_directory.h"

namespace kivd {
namespace {

class report_command : public report_files {};

// A sealed report, piece by piece, so that tests can spoil any of them.
struct envelope {
    std::string key, iv, secret;

    [[nodiscard]] std::string bytes() const {
        kiv::Report report = report_of(
            "header { product_id: '' software_version: '' software_variant: '' device_id: '' }");
        report.set_encryption_key(key);
        report.set_encryption_iv(iv);
        report.set_encrypted_compressed_data(secret);
        return report.SerializeAsString();
    }
};

constexpr report_format formats[] = {report_format::text, report_format::json, report_format::jsonl,
                                     report_format::csv, report_format::summary};

TEST_F(report_command, shows_every_file_it_can_and_tells_what_is_wrong_with_the_others) {
    const std::string records = records_of(header_text + event_text("shown"));
    const std::string good = write("kiv_1", gzip(records));
    const std::string torn = write("events", records + records_of(event_text("torn")).substr(0, 9));
    const std::string sealed = write("kiv_2", envelope{"k", "i", "secret"}.bytes());
    const std::string missing = directory / "kiv_3";
    const std::string empty = directory / "empty";
    std::filesystem::create_directory(empty);

    const std::string complaints =
        "kivtool: " + missing + ": cannot be opened: No such file or directory\n" +
        "kivtool: " + torn + ": stopped at byte " + std::to_string(records.size()) +
        ": the record there is cut short: it has 9 of its 17 bytes\n" + "kivtool: " + sealed +
        ": the report is sealed, give the private key that opens it with --key\n" +
        "kivtool: " + empty + ": is a directory without reports\n";

    for (const report_format format : formats) {
        SCOPED_TRACE(static_cast<int>(format));
        const auto [status, out, err] = show({missing, torn, sealed, empty, good}, {format});
        EXPECT_EQ(status, 1);
        EXPECT_NE(out.find("shown"), out.rfind("shown")) << out;  // in both files
        EXPECT_EQ(out.find("torn"), std::string::npos) << out;
        EXPECT_EQ(err, complaints);
        EXPECT_EQ(show({good}, {format}).status, 0);
        EXPECT_EQ(show({good}, {format, missing}).status, 1);  // no such key

        std::ofstream full("/dev/full");
        std::ostringstream problem;
        EXPECT_EQ(run_report_command({good}, {format}, full, problem), 1);
        EXPECT_EQ(problem.str(), "kivtool: the output could not be written\n");
    }
}

// Diagnostics files: events and nothing before them, the last one perhaps being written.
TEST_F(report_command, shows_files_without_a_header_and_the_messages_in_them) {
    const google::protobuf::LogSilencer silencer;
    const auto event = [](const std::string& package, const std::string& name,
                          const std::string& payload) {
        return records_of("events { package: '" + package + "' name: '" + name +
                          "' timestamp: 1262325600000 payload: '" + payload + "' }");
    };
    const std::string logged = R"(\010\003:\006am_anrB\004\033[m\n)";  // log 3, tag, msg
    const std::string messages = event("kiv.system_logging", "LogMessage", logged) +
                                 event("kernel", "ProcessKill", R"(\010\007)") +
                                 event("kiv", "DaemonError", R"(\n\001x\020\001)");
    const std::string others = event("kiv.system_logging", "LogMessage", R"(:\001t)") +  // no log
                               event("app", "ProcessKill", R"(\010\010)");
    const std::string whole = write("qz_1", gzip(messages + others));
    const shown text = show({whole}, {report_format::text});
    const shown summary = show({whole}, {report_format::summary});
    EXPECT_EQ(text.err + summary.err, "");
    EXPECT_EQ(records_of(text.out), messages + others);  // with the comments
    for (const std::string line :
         {R"(kiv.system_logging.LogMessage { log: EVENTS tag: "am_anr" msg: "\033[m\n" })",
          "kernel.ProcessKill { pid: 7 }", R"(kiv.DaemonError { log: "x" flooding: true })"}) {
        EXPECT_NE(text.out.find("\n  # " + line + "\n}"), std::string::npos) << text.out;
    }
    EXPECT_NE(summary.out.find("    2010-01-01 06:00:00  kernel.ProcessKill { pid: 7 }\n"),
              std::string::npos);
    for (const char* unknown : {"pid: 8", "\"t\" }"}) {
        EXPECT_EQ(text.out.find(unknown), std::string::npos) << text.out;
    }
    EXPECT_NE(summary.out.find("no header"), std::string::npos) << summary.out;
    const shown torn = show({write("qz_2", messages + others.substr(0, 9))}, {report_format::text});
    EXPECT_EQ(records_of(torn.out), messages);
    EXPECT_NE(torn.err.find("stopped at byte " + std::to_string(messages.size())),
              std::string::npos);
}

class sealed_reports : public report_files {
 protected:
    sealed_reports() { make_key(directory, "key"); }

    // Sealed by the openssl program for key.pub.pem.
    envelope seal(const std::string& content) {
        write("aes", "a one-time key!!");
        write("content", content);
        const outcome sealed = run("cd " + directory.string() +
                                   " && openssl pkeyutl -encrypt -pubin -inkey key.pub.pem"
                                   "    -in aes -out aes.sealed"
                                   " && openssl enc -aes-128-cbc -in content -out secret"
                                   "    -K 61206f6e652d74696d65206b65792121"
                                   "    -iv 30313233343536373839616263646566");
        EXPECT_EQ(sealed.status, 0) << sealed.output;
        return {read("aes.sealed"), "0123456789abcdef", read("secret")};
    }

    std::string read(const std::string& name) { return read_file(directory / name); }
};

TEST_F(sealed_reports, are_shown_as_plain_ones_are_with_the_key_that_opens_them) {
    const std::string content = gzip(records_of(header_text + event_text("shown")));
    const std::string plain = write("kiv_1", content);
    std::vector<std::string> plain_views;
    for (const report_format format : formats) plain_views.push_back(show({plain}, {format}).out);
    const report_options options = {report_format::text, directory / "key.pem"};
    write("kiv_1", seal(content).bytes());
    for (const report_format format : formats) {
        const auto [status, out, err] = show({plain}, {format, options.key_path});
        EXPECT_EQ(status, 0) << err;
        EXPECT_EQ(out, plain_views[static_cast<size_t>(format)]);
    }

    // What is torn or follows is told all the same.
    const std::string torn = content.substr(0, content.size() - 1);
    for (const std::string& bytes : {seal(content).bytes() + "?", seal(torn).bytes()}) {
        const auto [status, out, err] = show({write("kiv_1", bytes)}, options);
        EXPECT_EQ(status, 1);
        EXPECT_EQ(out, plain_views[0]);
        EXPECT_NE(err.find("stopped at byte"), std::string::npos) << err;
    }
    // One that does not open is told, and the next is shown.
    make_key(directory, "other");
    envelope damaged = seal(content), short_of_iv = damaged;
    damaged.secret[damaged.secret.size() - 1] ^= 1;
    short_of_iv.iv.pop_back();
    const std::string shut = "the report is sealed for another key, or damaged";
    const std::tuple<envelope, const char*, std::string> cases[] = {
        {seal(content), "other.pem", shut},
        {damaged, "key.pem", shut},
        {short_of_iv, "key.pem",
         "the report is sealed, but what is needed to open it is not all there"},
        {seal(gzip(damaged.bytes())), "key.pem", "the report is sealed twice"},
    };
    const std::string next = write("kiv_2", content);
    for (const auto& [bad, key, problem] : cases) {
        const auto [status, out, err] =
            show({write("kiv_1", bad.bytes()), next}, {report_format::text, directory / key});
        EXPECT_EQ(status, 1);
        EXPECT_NE(err.find("/kiv_1: " + problem), std::string::npos) << err;
        EXPECT_NE(out.find("# " + next), std::string::npos) << out;
    }
}

}  // namespace
}  // namespace kivd
