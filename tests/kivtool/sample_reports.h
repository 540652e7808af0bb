// Reports to read: their records as bytes, and files that hold them.
#pragma once

#include <google/protobuf/stubs/logging.h>
#include <google/protobuf/text_format.h>
#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <string_view>
#include <vector>

#include "kivtool/report/report_command.h"
#include "report.pb.h"
#include "support/config_package.h"

namespace kivd {

// The report with the fields that `text` has in protobuf's text format; it need not be complete.
inline kiv::Report report_of(const std::string& text) {
    google::protobuf::TextFormat::Parser parser;
    parser.AllowPartialMessage(true);
    kiv::Report report;
    EXPECT_TRUE(parser.ParseFromString(text, &report)) << text;
    return report;
}

inline std::string records_of(const std::string& text) {
    return report_of(text).SerializePartialAsString();
}

inline constexpr char header_text[] =
    "header { product_id: 'test_id' software_version: 'test_rev' software_variant: 'test_var'"
    " device_id: '2543c433' timezone: -5400 group_id: 'field-trial' }";

inline std::string event_text(const std::string& name, int64_t timestamp = 0,
                              const std::string& payload = "") {
    return "events { package: 'app' name: '" + name + "' timestamp: " + std::to_string(timestamp) +
           " payload: '" + payload + "' }";
}

inline std::string counter_text(const std::string& name, int64_t value, int64_t timestamp = 0) {
    return "counters { package: 'app' name: '" + name + "' value: " + std::to_string(value) +
           " from_timestamp: 0 to_timestamp: " + std::to_string(timestamp) + " }";
}

inline std::string static_text(const std::string& name, const std::string& value) {
    return "statics { package: 'app' name: '" + name + "' value: '" + value + "' timestamp: 0 }";
}

// A test with a directory of its own.
class report_files : public testing::Test {
 protected:
    report_files() {
        std::string name = testing::TempDir() + "kivtool-XXXXXX";
        EXPECT_NE(mkdtemp(name.data()), nullptr);
        directory = name;
    }
    ~report_files() override { std::filesystem::remove_all(directory); }

    struct shown {
        int status;
        std::string out, err;
    };
    static shown show(const std::vector<std::string>& paths, const report_options& options) {
        std::ostringstream out, err;
        const int status = run_report_command(paths, options, out, err);
        return {status, out.str(), err.str()};
    }

    std::string write(const std::string& name, std::string_view bytes) {
        const std::string path = directory / name;
        std::ofstream(path, std::ios::binary).write(bytes.data(), std::ssize(bytes));
        return path;
    }

    std::filesystem::path directory;
};

}  // namespace kivd
