// A report in a few lines for people.
#pragma once

#include <ostream>
#include <string>

#include "tools/report_reader.h"

namespace kivd {

// Who the report is from, the time it spans, what is in it. Text from the report is made fit for a
// terminal and cut; times are UTC.
void print_summary(std::ostream& out, const std::string& path, const report_file& file);

}  // namespace kivd
