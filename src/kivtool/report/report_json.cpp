#include "kivtool/report/report_json.h"

#include <google/protobuf/descriptor.h>

#include <set>
#include <string>
#include <utility>

#include "kivtool/report/message_json.h"

namespace kivd {
namespace {

using google::protobuf::FieldDescriptor;

json record_json(const report_record& record) {
    if (record.message) {
        json object = json::object();
        add_fields(object, *record.message);
        return object;
    }
    kiv::Report alone;
    (void)alone.ParsePartialFromArray(record.bytes.data(), static_cast<int>(record.bytes.size()));
    return field_json(alone, *record.field);
}

// The daemon writes a header, then events, then counters, then static data, so each list can be
// written as its records arrive. A record that belongs to a list already closed is left out, and an
// error says so: showing it would mean keeping everything else on disk until the end.
class json_view : public report_view {
 public:
    explicit json_view(std::ostream& out) : out_(out) {}

    void start_file(const std::string& /*path*/) override {
        out_ << "{\n";
        open_list_ = nullptr;
        shown_.clear();
        problem_.clear();
    }

    void add(const report_record& record) override {
        const FieldDescriptor* const field = record.field;
        if (field == open_list_) {
            out_ << ",\n";
        } else if (shown_.contains(field)) {
            problem_ = field->is_repeated()
                           ? "JSON has room for one list of " + field->name() +
                                 ", those behind other records are not shown; jsonl shows all"
                           : "JSON has room for one " + field->name() +
                                 ", the others in the file are not shown";
            return;
        } else {
            start_field(*field);
        }
        out_ << record_json(record).dump();
    }

    std::string finish_file(const report_reader& /*file*/) override {
        close_list();
        out_ << "\n}\n";
        return std::move(problem_);
    }

 private:
    void start_field(const FieldDescriptor& field) {
        close_list();
        if (!shown_.empty()) out_ << ",\n";
        shown_.insert(&field);
        out_ << '"' << field.name() << "\": ";
        if (!field.is_repeated()) return;
        out_ << "[\n";
        open_list_ = &field;
    }

    void close_list() {
        if (std::exchange(open_list_, nullptr)) out_ << "\n]";
    }

    std::ostream& out_;
    const FieldDescriptor* open_list_ = nullptr;
    std::set<const FieldDescriptor*> shown_;
    std::string problem_;
};

class json_lines_view : public report_view {
 public:
    explicit json_lines_view(std::ostream& out) : out_(out) {}

    void start_file(const std::string& path) override { file_ = json_text(path); }

    void add(const report_record& record) override {
        json line = {{"file", file_}, {"kind", record_kind(record)}};
        if (record.message) {
            add_fields(line, *record.message);
        } else {
            line[record.field->name()] = record_json(record);
        }
        out_ << line.dump() << '\n';
    }

    std::string finish_file(const report_reader& /*file*/) override { return ""; }

 private:
    std::ostream& out_;
    json file_;
};

}  // namespace

std::unique_ptr<report_view> make_json_view(std::ostream& out) {
    return std::make_unique<json_view>(out);
}

std::unique_ptr<report_view> make_json_lines_view(std::ostream& out) {
    return std::make_unique<json_lines_view>(out);
}

const char* record_kind(const report_record& record) {
    switch (record.field->number()) {
        case kiv::Report::kEventsFieldNumber:
            return "event";
        case kiv::Report::kCountersFieldNumber:
            return "counter";
        case kiv::Report::kStaticsFieldNumber:
            return "static";
        default:
            return record.field->name().c_str();
    }
}

}  // namespace kivd
