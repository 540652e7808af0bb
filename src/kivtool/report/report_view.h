// Ways to show reports.
#pragma once

#include <string>

#include "kivtool/report/report_reader.h"

namespace kivd {

// Takes the records of one file after the other, and shows them at once or at the end.
class report_view {
 public:
    report_view() = default;
    virtual ~report_view() = default;
    report_view(const report_view&) = delete;
    report_view& operator=(const report_view&) = delete;

    // Comes before the first record of a file; not for files without records.
    virtual void start_file(const std::string& path) = 0;
    virtual void add(const report_record& record) = 0;
    // Comes at its end. Returns what could not be shown, as the end of a sentence.
    virtual std::string finish_file(const report_reader& file) = 0;
    // Comes after all files.
    virtual void finish() {}
};

}  // namespace kivd
