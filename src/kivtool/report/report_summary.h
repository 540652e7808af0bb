// Reports in a few lines for people.
#pragma once

#include <memory>
#include <optional>
#include <ostream>
#include <string>

#include "kivtool/report/report_view.h"

namespace kivd {

// For each file, who the report is from, the time it spans, what is in it; then the same for all of
// them together, when there are several: counters and static data with the latest value that any of
// them has. Text from the reports is made fit for a terminal and cut; times are UTC. `plot_path` is
// that of a picture to draw of all events.
[[nodiscard]] std::unique_ptr<report_view> make_summary_view(
    std::ostream& out, const std::optional<std::string>& plot_path);

}  // namespace kivd
