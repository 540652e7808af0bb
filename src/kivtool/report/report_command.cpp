#include "kivtool/report/report_command.h"

#include <exception>
#include <memory>

#include "kivtool/report/progress_line.h"
#include "kivtool/report/report_csv.h"
#include "kivtool/report/report_json.h"
#include "kivtool/report/report_paths.h"
#include "kivtool/report/report_reader.h"
#include "kivtool/report/report_summary.h"
#include "kivtool/report/report_text.h"
#include "toolkit/keys.h"
#include "toolkit/text_escape.h"

namespace kivd {
namespace {

std::unique_ptr<report_view> make_view(const report_options& options, std::ostream& out) {
    switch (options.format) {
        case report_format::text:
            return make_text_view(out);
        case report_format::json:
            return make_json_view(out);
        case report_format::jsonl:
            return make_json_lines_view(out);
        case report_format::csv:
            return make_csv_view(out);
        case report_format::summary:
            return make_summary_view(out);
    }
    return nullptr;
}

// Shows one file after the other and remembers whether something was wrong.
class report_shower {
 public:
    report_shower(report_view& view, EVP_PKEY* key, const report_options& options,
                  std::ostream& out, std::ostream& err)
        : view_(view),
          key_(key),
          out_(out),
          err_(err),
          progress_(options.show_progress ? &err : nullptr) {}

    void expect(size_t files) { files_ += files; }

    void show(const std::string& path) {
        std::string problem;
        try {
            problem = show_records(path);
        } catch (const std::exception& error) {
            problem = error.what();
        }
        ++files_done_;
        tell(path, problem);
    }

    void finish() {
        progress_.clear();
        view_.finish();
        out_.flush();
    }

    void tell(const std::string& path, const std::string& problem) {
        if (problem.empty()) return;
        progress_.clear();
        out_.flush();  // so that faults come after what could be read
        err_ << "kivtool: " << printable(path) << ": " << problem << '\n';
        status_ = 1;
    }

    [[nodiscard]] int status() const { return status_; }

 private:
    std::string show_records(const std::string& path) {
        report_reader reader(path, key_);
        bool is_started = false;
        while (const report_record* record = reader.next()) {
            if (!is_started) view_.start_file(path);
            is_started = true;
            view_.add(*record);
            progress_.show(files_done_, files_, ++records_);
            if (!out_) return "";  // the rest could not be written either
        }
        if (!is_started) return reader.problem();
        progress_.clear();
        std::string problem = view_.finish_file(reader);
        if (reader.problem().empty()) return problem;
        return reader.problem() + (problem.empty() ? "" : "; " + problem);
    }

    report_view& view_;
    EVP_PKEY* key_;
    std::ostream& out_;
    std::ostream& err_;
    progress_line progress_;
    size_t files_ = 0;
    size_t files_done_ = 0;
    uint64_t records_ = 0;
    int status_ = 0;
};

}  // namespace

int run_report_command(const std::vector<std::string>& paths, const report_options& options,
                       std::ostream& out, std::ostream& err) try {
    unique_pkey key;
    if (options.key_path) key = read_key(*options.key_path, key_half::private_half);
    const std::unique_ptr<report_view> view = make_view(options, out);
    report_shower shower(*view, key.get(), options, out, err);
    const std::vector<report_paths> all(paths.begin(), paths.end());
    for (const report_paths& each : all) shower.expect(each.size());
    for (size_t i = 0; i < all.size(); ++i) {
        for (size_t k = 0; out && k < all[i].size(); ++k) shower.show(all[i].path(k));
        shower.tell(paths[i], all[i].problem());
    }
    shower.finish();
    if (!out) {
        err << "kivtool: the output could not be written\n";
        return 1;
    }
    return shower.status();
} catch (const std::exception& error) {
    err << "kivtool: " << error.what() << '\n';
    return 1;
}

}  // namespace kivd
