#include "kivtool/report/report_json.h"

#include <google/protobuf/descriptor.h>

#include <cerrno>
#include <cstring>
#include <map>
#include <stdexcept>
#include <string>
#include <utility>

#include "kivtool/report/json_text.h"
#include "util/unique_fd.h"

namespace kivd {
namespace {

// The record's value in JSON.
void append_record(std::string& to, const report_record& record) {
    if (record.message) {
        to += '{';
        append_json_fields(to, *record.message);
        to += '}';
        return;
    }
    kiv::Report alone;
    (void)alone.ParsePartialFromArray(record.bytes.data(), static_cast<int>(record.bytes.size()));
    append_json_value(to, alone, *record.field);
}

// Text that is kept on disk until it is its turn.
class kept_text {
 public:
    void append(const std::string& text) {
        if (!file_) file_.reset(tmpfile());
        if (!file_ || fwrite(text.data(), 1, text.size(), file_.get()) < text.size()) fail();
    }

    void copy_to(std::ostream& out) {
        if (!file_) return;
        if (fflush(file_.get()) != 0) fail();
        rewind(file_.get());
        char piece[16384];
        while (const size_t size = fread(piece, 1, sizeof piece, file_.get())) {
            out.write(piece, static_cast<std::streamsize>(size));
        }
        if (ferror(file_.get())) fail();
    }

 private:
    [[noreturn]] static void fail() {
        throw std::runtime_error(std::string("cannot be kept in a temporary file: ") +
                                 strerror(errno));
    }

    unique_file file_;
};

class json_view : public report_view {
 public:
    explicit json_view(std::ostream& out) : out_(out) {}

    void start_file(const std::string& /*path*/) override {
        out_ << "{\n";
        is_empty_ = true;
        open_list_ = -1;
        seen_.clear();
        problem_.clear();
    }

    void add(const report_record& record) override {
        const int number = record.field->number();
        text_.clear();
        if (record.field->is_repeated() && number == open_list_) {
            text_ += ",\n";
            append_record(text_, record);
            out_ << text_;
            return;
        }
        const auto [found, is_new] = seen_.try_emplace(number);
        section& seen = found->second;
        if (!is_new && !record.field->is_repeated()) {
            problem_ = "JSON has room for one " + record.field->name() +
                       ", the others in the file are not shown";
            return;
        }
        if (is_new) {
            text_ = '"' + record.field->name() + "\": ";
            seen.is_list = record.field->is_repeated();
            if (seen.is_list) text_ += "[\n";
        } else {
            text_ += ",\n";
        }
        append_record(text_, record);
        if (open_list_ >= 0) return seen.later.append(text_);
        seen.is_out = true;
        if (seen.is_list) open_list_ = number;
        write_section_start();
        out_ << text_;
    }

    std::string finish_file(const report_reader& /*file*/) override {
        if (open_list_ >= 0) out_ << "\n]";
        for (auto& [number, each] : seen_) {
            if (each.is_out) continue;
            write_section_start();
            each.later.copy_to(out_);
            if (each.is_list) out_ << "\n]";
        }
        seen_.clear();
        out_ << "\n}\n";
        return std::move(problem_);
    }

 private:
    // A field of the report.
    struct section {
        bool is_list = false;
        bool is_out = false;  // has been written, or is the open list
        kept_text later;      // else what to write
    };

    void write_section_start() {
        if (!is_empty_) out_ << ",\n";
        is_empty_ = false;
    }

    std::ostream& out_;
    bool is_empty_ = true;  // the document so far
    int open_list_ = -1;    // the field whose records are written as they come
    std::map<int, section> seen_;
    std::string problem_;
    std::string text_;
};

class json_lines_view : public report_view {
 public:
    explicit json_lines_view(std::ostream& out) : out_(out) {}

    void start_file(const std::string& path) override {
        file_ = "{\"file\":";
        append_json_string(file_, path);
        file_ += ",\"kind\":\"";
    }

    void add(const report_record& record) override {
        text_ = file_;
        text_ += record_kind(record);
        text_ += "\",";
        if (record.message) {
            append_json_fields(text_, *record.message);
            if (text_.ends_with(',')) text_.pop_back();
        } else {
            text_ += '"' + record.field->name() + "\":";
            append_record(text_, record);
        }
        text_ += "}\n";
        out_ << text_;
    }

    std::string finish_file(const report_reader& /*file*/) override { return ""; }

 private:
    std::ostream& out_;
    std::string file_;  // how each line starts
    std::string text_;
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
