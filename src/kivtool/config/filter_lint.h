// Filters that the daemon would not use as they are written.
#pragma once

#include "kivtool/config/config_source.h"
#include "kivtool/config/lint_findings.h"

namespace kivd {

// Looks over a part kivd:FilterConfig.
void lint_filters(const part_content& part, lint_findings& findings);

}  // namespace kivd
