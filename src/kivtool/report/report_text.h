// Reports as protobuf text.
#pragma once

#include <memory>
#include <ostream>

#include "kivtool/report/report_view.h"

namespace kivd {

// Protobuf's text format, which can be encoded again. A comment line in front names the file; after
// the fields of an event whose payload is a known message, another one shows that message.
[[nodiscard]] std::unique_ptr<report_view> make_text_view(std::ostream& out);

}  // namespace kivd
