// Translates what the kernel records when it kills a process into the message that the event
// "ProcessKill" of package "kernel" carries.
#pragma once

#include <cstdint>
#include <span>
#include <string_view>

#include "util/unique_fd.h"

namespace kivd {

// The packed kernel.ProcessKill of a raw record goes to `packed`, a block of malloc. Gives its
// size, or -1: such events are not known, the record is too short, or there is no memory; logged
// and raised.
[[nodiscard]] int32_t translate_event(std::string_view package, std::string_view name,
                                      std::span<const char> record, unique_malloc<uint8_t>& packed);

}  // namespace kivd
