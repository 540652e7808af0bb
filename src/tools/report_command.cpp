#include "tools/report_command.h"

#include <exception>

#include "tools/report_printer.h"
#include "tools/report_reader.h"
#include "tools/report_summary.h"
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

// Gives what is wrong with the file, empty when all is well.
std::string show_report(const std::string& path, report_view view, bool is_first,
                        std::ostream& out) {
    const report_file file = read_report(path);
    if (is_sealed(file.report)) {
        return "the report is sealed, only its private report key can open it" +
               (file.problem.empty() ? "" : "; " + file.problem);
    }
    if (file.data_size > 0) {
        if (!is_first && view != report_view::json) out << '\n';
        print_report(out, path, file, view);
    }
    return file.problem;
}

}  // namespace

int run_report_command(const std::vector<std::string>& paths, report_view view, std::ostream& out,
                       std::ostream& err) {
    int status = 0;
    for (size_t i = 0; i < paths.size(); ++i) {
        std::string problem;
        try {
            problem = show_report(paths[i], view, i == 0, out);
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
