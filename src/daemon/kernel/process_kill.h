// Translates what the kernel records when it kills a process into the message that the event
// "ProcessKill" of package "kernel" carries.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string_view>

#include "util/releaser.h"

namespace kivd {

struct packed_event {
    unique_malloc<uint8_t> bytes;
    size_t size;
};

// The packed kernel.ProcessKill of a raw record. Nothing, which has been logged and raised, when it
// is another kind of event, the record is too short, or there is no memory.
[[nodiscard]] std::optional<packed_event> translate_event(std::string_view package,
                                                          std::string_view name,
                                                          std::span<const char> record);

}  // namespace kivd
