// Reports in a few lines for people.
#pragma once

#include <memory>
#include <ostream>

#include "kivtool/report/report_view.h"

namespace kivd {

// For each file, who the report is from, the time it spans, what is in it; then the same for all of
// them together, when there are several: counters and static data with the latest value that any of
// them has. Text from the reports is made fit for a terminal and cut; times are UTC.
[[nodiscard]] std::unique_ptr<report_view> make_summary_view(std::ostream& out);

}  // namespace kivd
