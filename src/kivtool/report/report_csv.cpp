#include "kivtool/report/report_csv.h"

#include <cstdio>
#include <string>

#include "kivtool/report/known_payload.h"
#include "kivtool/report/report_json.h"
#include "kivtool/report/time_text.h"
#include "toolkit/text_escape.h"

namespace kivd {
namespace {

std::string csv_time(int64_t ms) {
    std::string seconds = time_text(ms, "%Y-%m-%dT%H:%M:%S");
    if (seconds.ends_with("ms")) return seconds;
    char rest[8];
    snprintf(rest, sizeof rest, ".%03dZ", static_cast<int>(ms % 1000));
    return seconds + rest;
}

std::string quoted(std::string_view text) {
    std::string field = printable(text, std::string_view::npos);
    if (field.find_first_of(",\"") == std::string::npos && !field.starts_with(' ') &&
        !field.ends_with(' ')) {
        return field;
    }
    for (size_t at = 0; (at = field.find('"', at)) != std::string::npos; at += 2) {
        field.insert(at, 1, '"');
    }
    return '"' + field + '"';
}

std::string message_text(const google::protobuf::Message& message) {
    std::string text = one_line(message);
    while (text.ends_with(' ')) text.pop_back();
    return text;
}

class csv_view : public report_view {
 public:
    explicit csv_view(std::ostream& out) : out_(out) {}

    void start_file(const std::string& path) override {
        if (file_.empty()) out_ << "kind,time,package,name,value,payload,file\n";
        file_ = ',' + quoted(path) + '\n';
    }

    void add(const report_record& record) override {
        line_ = record_kind(record);
        switch (record.field->number()) {
            case kiv::Report::kEventsFieldNumber:
                add_probe(get<kiv::Event>(record), get<kiv::Event>(record).timestamp());
                line_ += ',' + quoted(get<kiv::Event>(record).payload());
                break;
            case kiv::Report::kCountersFieldNumber:
                add_probe(get<kiv::Counter>(record), get<kiv::Counter>(record).to_timestamp());
                line_ += std::to_string(get<kiv::Counter>(record).value()) + ',';
                break;
            case kiv::Report::kStaticsFieldNumber:
                add_probe(get<kiv::StaticData>(record), get<kiv::StaticData>(record).timestamp());
                line_ += quoted(get<kiv::StaticData>(record).value()) + ',';
                break;
            default:
                line_ += ",,,," + quoted(record.message ? message_text(*record.message)
                                                        : std::string(record.bytes));
                line_ += ',';
        }
        line_ += file_;
        out_ << line_;
    }

    std::string finish_file(const report_reader& /*file*/) override { return ""; }

 private:
    template <class message>
    void add_probe(const message& probe, int64_t time) {
        line_ += ',' + csv_time(time) + ',' + quoted(probe.package()) + ',' + quoted(probe.name());
        line_ += ',';
    }

    std::ostream& out_;
    std::string file_;  // how each line ends
    std::string line_;
};

}  // namespace

std::unique_ptr<report_view> make_csv_view(std::ostream& out) {
    return std::make_unique<csv_view>(out);
}

}  // namespace kivd
