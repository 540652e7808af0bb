// Reports as comma-separated values.
#pragma once

#include <memory>
#include <ostream>

#include "kivtool/report/report_view.h"

namespace kivd {

// A line of column names, then a line for each record: kind, time, package, name, value (of
// counters and static data; protobuf text for other records), payload (of events), file. Times
// are UTC, "2010-01-01T06:00:00.000Z". Bytes that are not UTF-8 and control characters become \xHH,
// a backslash becomes two. Fields are in double quotes where necessary.
[[nodiscard]] std::unique_ptr<report_view> make_csv_view(std::ostream& out);

}  // namespace kivd
