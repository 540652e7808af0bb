// Reports as JSON; message_json.h says how values are written.
#pragma once

#include <memory>
#include <ostream>

#include "kivtool/report/report_view.h"

namespace kivd {

// One document for each file, one record per line, in the order of the file. A field of a report
// that comes again after other fields is left out, and finish_file() says so.
[[nodiscard]] std::unique_ptr<report_view> make_json_view(std::ostream& out);

// One object for each record, on one line: "file", "kind" (see record_kind), and the record's own
// fields.
[[nodiscard]] std::unique_ptr<report_view> make_json_lines_view(std::ostream& out);

// header, event, counter or static; for any other record, the name of its field in the schema.
[[nodiscard]] const char* record_kind(const report_record& record);

}  // namespace kivd
