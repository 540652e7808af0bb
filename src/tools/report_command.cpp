#include "tools/report_command.h"

#include <exception>

#include "tools/keys.h"
#include "tools/report_printer.h"
#include "tools/report_reader.h"
#include "tools/report_summary.h"
#include "tools/sealed_report.h"
#include "tools/text_escape.h"

namespace kivd {
namespace {

void print_report(std::ostream& out, const std::string& path, const report_file& file,
                  report_view view) {
    switch (view) {
        case report_view::text:
            return print_text(out, path, file.report);
        case report_view::json:
            return print_json(out, file.report);
        case report_view::summary:
            return print_summary(out, path, file);
    }
}

// Puts the report that is sealed in `file` in its place. Gives what is wrong, empty when it is
// open.
std::string unseal(report_file& file, EVP_PKEY* key) {
    if (!key) return "the report is sealed, give the private key that opens it with --key";
    std::string content;
    std::string problem = open_sealed(file.report, *key, content);
    if (!problem.empty()) return problem;
    file = {};  // before what it holds is in memory once more
    file = read_report_bytes(content, "the sealed data");
    return is_sealed(file.report) ? "the report is sealed twice" : "";
}

// Gives what is wrong with the file, empty when all is well.
std::string show_report(const std::string& path, report_view view, EVP_PKEY* key, bool is_first,
                        std::ostream& out) {
    report_file file = read_report(path);
    std::string seal_problem;
    if (is_sealed(file.report)) {
        seal_problem = file.problem;
        const std::string problem = unseal(file, key);
        if (!problem.empty()) return problem + (seal_problem.empty() ? "" : "; " + seal_problem);
    }
    if (file.data_size > 0) {
        if (!is_first && view != report_view::json) out << '\n';
        print_report(out, path, file, view);
    }
    return file.problem.empty() ? seal_problem : file.problem;
}

}  // namespace

int run_report_command(const std::vector<std::string>& paths, const report_options& options,
                       std::ostream& out, std::ostream& err) {
    unique_pkey key;
    if (options.key_path) {
        const std::string problem = read_key(*options.key_path, key_half::private_half, key);
        if (!problem.empty()) {
            err << "kivtool: " << problem << '\n';
            return 1;
        }
    }
    int status = 0;
    for (size_t i = 0; i < paths.size(); ++i) {
        std::string problem;
        try {
            problem = show_report(paths[i], options.view, key.get(), i == 0, out);
        } catch (const std::exception& error) {
            problem = error.what();
        }
        out.flush();  // what could be read stands before what went wrong
        if (!problem.empty()) {
            err << "kivtool: " << printable(paths[i]) << ": " << problem << '\n';
            status = 1;
        }
    }
    if (!out) {
        err << "kivtool: the output could not be written\n";
        return 1;
    }
    return status;
}

}  // namespace kivd
