// Reports as comma-separated values.
#pragma once

#include <memory>
#include <ostream>

#include "kivtool/report/report_view.h"

namespace kivd {

// A line of column names, then a line for each record: kind, time, package, name, value (of
// counters and static data; any other record as protobuf text), payload (of events), file. Times
// are UTC, "2010-01-01T06:00:00.000Z". Bytes that are not UTF-8 and control characters become \xHH,
// a backslash becomes two. Fields that need it are in double quotes.
[[nodiscard]] std::unique_ptr<report_view> make_csv_view(std::ostream& out);

}  // namespace kivd
