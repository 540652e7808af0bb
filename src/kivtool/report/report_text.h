// Reports as protobuf text.
#pragma once

#include <memory>
#include <ostream>

#include "kivtool/report/report_view.h"

namespace kivd {

// Protobuf's text format behind a comment line that names the file, so that the whole can be
// encoded again. Behind the fields of an event whose payload is a known message, a comment line
// shows that.
[[nodiscard]] std::unique_ptr<report_view> make_text_view(std::ostream& out);

}  // namespace kivd
