// Reports as JSON; message_json.h says how values are written.
#pragma once

#include <memory>
#include <ostream>

#include "kivtool/report/report_view.h"

namespace kivd {

// One document for each file, a record a line, in the order of the file. Each field of a report has
// one place in it: what comes again behind other fields is left out, which finish_file() tells.
[[nodiscard]] std::unique_ptr<report_view> make_json_view(std::ostream& out);

// One object for each record, in a line: "file", "kind" (as record_kind has it), and the record's
// own fields.
[[nodiscard]] std::unique_ptr<report_view> make_json_lines_view(std::ostream& out);

// What a record is called: header, event, counter, static; else its field in the schema.
[[nodiscard]] const char* record_kind(const report_record& record);

}  // namespace kivd
