// Reports in a few lines for people.
#pragma once

#include <memory>
#include <ostream>

#include "kivtool/report/report_view.h"

namespace kivd {

// For each file, who the report is from, the time it spans and what is in it. Several files are
// followed by the same for all of them together, with the latest value of each counter and static
// value. Text from reports is escaped for a terminal and cut; times are UTC.
[[nodiscard]] std::unique_ptr<report_view> make_summary_view(std::ostream& out);

}  // namespace kivd
