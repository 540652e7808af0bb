#include "tools/report_command.h"

#include <sstream>

#include "outside_tools.h"
#include "sample_reports.h"

namespace kivd {
namespace {

class report_command : public report_files {};

constexpr report_format formats[] = {report_format::text, report_format::json, report_format::jsonl,
                                     report_format::csv, report_format::summary};

TEST_F(report_command, shows_every_file_it_can_and_tells_what_is_wrong_with_the_others) {
    const std::string records = records_of(header_text + event_text("shown"));
    const std::string good = write("kiv_1", gzip(records));
    const std::string torn = write("events", records + records_of(event_text("torn")).substr(0, 9));
    const std::string sealed = write(
        "kiv_2", records_of("header { product_id: '' software_version: '' software_variant: ''"
                            " device_id: '' } encryption_key: 'k' encryption_iv: 'i'"
                            " encrypted_compressed_data: 'secret'"));
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
        std::ostringstream out, err;
        EXPECT_EQ(run_report_command({missing, torn, sealed, empty, good}, {format}, out, err), 1);
        const std::string text = out.str();
        EXPECT_NE(text.find("shown"), text.rfind("shown")) << text;  // in both files
        EXPECT_EQ(text.find("torn"), std::string::npos) << text;
        EXPECT_EQ(err.str(), complaints);

        std::ostringstream good_err;
        EXPECT_EQ(run_report_command({good}, {format}, out, good_err), 0) << good_err.str();
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
                               event("kernel", "ProcessKill", "text") +
                               event("app", "ProcessKill", R"(\010\010)") +
                               event("kernel", "Processkill", R"(\010\011)");
    const std::string shown[] = {
        R"(kiv.system_logging.LogMessage { log: EVENTS tag: "am_anr" msg: "\033[m\n" })",
        "kernel.ProcessKill { pid: 7 }",
        R"(kiv.DaemonError { log: "x" flooding: true })",
    };
    for (const std::string& bytes : {messages + others, gzip(messages + others)}) {
        const std::string whole = write("qz_1", bytes);
        std::ostringstream text, json, summary, err;
        EXPECT_EQ(run_report_command({whole}, {report_format::text}, text, err), 0);
        EXPECT_EQ(run_report_command({whole}, {report_format::json}, json, err), 0);
        EXPECT_EQ(run_report_command({whole}, {report_format::summary}, summary, err), 0);
        EXPECT_EQ(err.str(), "");
        EXPECT_EQ(records_of(text.str()), messages + others);  // with the comments
        for (const std::string& line : shown) {
            EXPECT_NE(text.str().find("\n  # " + line + "\n}"), std::string::npos) << text.str();
            std::string escaped = line;
            if (line == shown[0]) escaped = escaped.replace(escaped.find(R"(\033)"), 1, R"(\\)");
            if (line == shown[0]) escaped = escaped.replace(escaped.find(R"(\n)"), 1, R"(\\)");
            EXPECT_NE(summary.str().find("    2010-01-01 06:00:00  " + escaped + "\n"),
                      std::string::npos)
                << summary.str();
            EXPECT_EQ(json.str().find(line), std::string::npos);
        }
        EXPECT_NE(json.str().find("\"CAc=\""), std::string::npos) << json.str();
        for (const char* unknown : {"pid: 8", "pid: 9", "\"t\" }"}) {
            EXPECT_EQ(text.str().find(unknown), std::string::npos) << text.str();
        }
        EXPECT_NE(summary.str().find("no header"), std::string::npos) << summary.str();
    }
    const std::string torn = write("qz_2", messages + others.substr(0, 9));
    std::ostringstream out, err;
    EXPECT_EQ(run_report_command({torn}, {report_format::text}, out, err), 1);
    EXPECT_EQ(records_of(out.str()), messages);
    EXPECT_NE(err.str().find("stopped at byte " + std::to_string(messages.size())),
              std::string::npos)
        << err.str();
}

TEST_F(report_command, tells_when_its_output_is_lost) {
    const std::string good = write("kiv_1", records_of(header_text));
    for (const report_format format : formats) {
        std::ofstream full("/dev/full");
        std::ostringstream err;
        EXPECT_EQ(run_report_command({good}, {format}, full, err), 1);
        EXPECT_EQ(err.str(), "kivtool: the output could not be written\n");
    }
}

constexpr char empty_header[] =
    "header { product_id: '' software_version: '' software_variant: '' device_id: '' }";

// A sealed report, piece by piece, so that tests can spoil any of them.
struct envelope {
    std::string key, iv, secret;

    [[nodiscard]] std::string bytes() const {
        kiv::Report report = report_of(empty_header);
        report.set_encryption_key(key);
        report.set_encryption_iv(iv);
        report.set_encrypted_compressed_data(secret);
        return report.SerializeAsString();
    }
};

class sealed_reports : public report_files {
 protected:
    sealed_reports() { make_key(directory, "key"); }

    // Sealed by the openssl program for key.pub.pem.
    envelope seal(const std::string& content, const std::string& aes_key = "a one-time key!!") {
        write("aes", aes_key);
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

    std::string read(const std::string& name) {
        std::ostringstream bytes;
        bytes << std::ifstream(directory / name, std::ios::binary).rdbuf();
        return bytes.str();
    }
};

TEST_F(sealed_reports, are_shown_as_plain_ones_are_with_the_key_that_opens_them) {
    const std::string content = gzip(records_of(header_text + event_text("shown")));
    const std::string plain = write("kiv_1", content);
    std::vector<std::string> shown;
    for (const report_format format : formats) {
        std::ostringstream out, err;
        EXPECT_EQ(run_report_command({plain}, {format}, out, err), 0);
        shown.push_back(out.str());
    }
    write("kiv_1", seal(content).bytes());
    const report_options options = {report_format::text, directory / "key.pem"};
    for (const report_format format : formats) {
        SCOPED_TRACE(static_cast<int>(format));
        std::ostringstream out, err;
        EXPECT_EQ(run_report_command({plain}, {format, options.key_path}, out, err), 0)
            << err.str();
        EXPECT_EQ(out.str(), shown[static_cast<size_t>(format)]);
    }

    // What is torn or follows is told all the same.
    const std::string torn = content.substr(0, content.size() - 1);
    for (const std::string& bytes : {seal(content).bytes() + "?", seal(torn).bytes()}) {
        write("kiv_1", bytes);
        std::ostringstream out, err;
        EXPECT_EQ(run_report_command({plain}, options, out, err), 1);
        EXPECT_EQ(out.str(), shown[0]);
        EXPECT_NE(err.str().find("stopped at byte"), std::string::npos) << err.str();
    }
}

TEST_F(sealed_reports, that_do_not_open_are_told_and_the_next_is_shown) {
    make_key(directory, "other");
    make_key(directory, "ec", "EC -pkeyopt ec_paramgen_curve:P-256");
    const std::string content = gzip(records_of(header_text + event_text("shown")), 0);
    const envelope good = seal(content);
    const auto spoilt = [&](std::string envelope::*piece, size_t at) {
        envelope bad = good;
        (bad.*piece)[at] = static_cast<char>((bad.*piece)[at] ^ 1);
        return bad;
    };
    const auto with = [&](std::string envelope::*piece, std::string value) {
        envelope bad = good;
        bad.*piece = std::move(value);
        return bad;
    };
    const std::string shut = "the report is sealed for another key, or damaged";
    const std::string not_all = "what is needed to open it is not all there";
    const struct {
        const char* what;
        envelope bad;
        std::string problem;
        const char* key = "key.pem";
    } cases[] = {
        {"other key", good, shut, "other.pem"},
        {"no RSA key", good, shut, "ec.pem"},
        {"one-time key", spoilt(&envelope::key, 100), shut},
        {"one-time key too short", seal(content, "15 bytes, no 16"), shut},
        {"IV", spoilt(&envelope::iv, 0), shut},
        {"IV too short", with(&envelope::iv, "0123456789abcde"), not_all},
        {"data too short", with(&envelope::secret, good.secret.substr(1)), shut},
        {"data without its end", with(&envelope::secret, good.secret.substr(0, 32)), shut},
        {"no data", with(&envelope::secret, ""), shut},
        {"data", spoilt(&envelope::secret, 40), "stopped at byte"},
        {"no gzip", seal(records_of(header_text)), shut},
        {"twice", seal(gzip(good.bytes())), "the report is sealed twice"},
    };
    for (const auto& bad : cases) {
        SCOPED_TRACE(bad.what);
        const std::string first = write("kiv_1", bad.bad.bytes());
        const std::string second = write("kiv_2", content);
        std::ostringstream out, err;
        EXPECT_EQ(run_report_command({first, second}, {report_format::text, directory / bad.key},
                                     out, err),
                  1);
        EXPECT_TRUE(err.str().starts_with("kivtool: " + first + ": ")) << err.str();
        EXPECT_NE(err.str().find(bad.problem), std::string::npos) << err.str();
        EXPECT_NE(out.str().find("# " + second), std::string::npos) << out.str();
    }

    for (const char* key : {"none.pem", "key.pub.pem"}) {
        std::ostringstream out, err;
        const std::string path = directory / key;
        EXPECT_EQ(run_report_command({"kiv_1"}, {report_format::text, path}, out, err), 1);
        EXPECT_TRUE(err.str().starts_with("kivtool: " + path + ": ")) << err.str();
    }
}

}  // namespace
}  // namespace kivd
