// Reports as JSON; json_text.h says how values are put.
#pragma once

#include <memory>
#include <ostream>

#include "kivtool/report/report_view.h"

namespace kivd {

// One document for each file, a record a line. Lists whose records don't come first are kept in a
// temporary file until the end of the report. A field that is no list has room for one record.
[[nodiscard]] std::unique_ptr<report_view> make_json_view(std::ostream& out);

// One object for each record, in a line: "file", "kind" (as record_kind has it), and the record's
// own fields.
[[nodiscard]] std::unique_ptr<report_view> make_json_lines_view(std::ostream& out);

// What a record is called: header, event, counter, static; else its field in the schema.
[[nodiscard]] const char* record_kind(const report_record& record);

}  // namespace kivd
