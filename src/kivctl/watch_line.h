// Request packets as lines for people. A packet is whatever a producer sent, so everything is
// escaped for a terminal and cut.
#pragma once

#include <string>
#include <string_view>

namespace kivd {

// The size of the request, its command, the probe if it names one, and what else it carries:
// "   15  EV  app start  2 bytes: 01 FF". Without a line end.
[[nodiscard]] std::string describe_request(std::string_view packet);

// The package of the probe that the request names; empty when it names none.
[[nodiscard]] std::string package_of(std::string_view packet);

}  // namespace kivd
