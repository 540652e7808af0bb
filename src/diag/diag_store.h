// The diagnostics store: while it is active, a short rolling history of a few kinds of events
// (shutdowns and boots, crashes, calls that failed) in files of its own. It is offered every event
// request, whatever the filters say. Only the newest few files stay, compressed but for the last.
#pragma once

#include <cstdint>
#include <span>

namespace kivd {

inline constexpr uint32_t diag_reserved_space = 327680;  // bytes that stay free while it is active

// 0 switches the store off and deletes all that it has kept; any other value switches it on.
// Failures have been logged and raised.
void diag_set_active(int32_t value);

// Keeps the event if the store is active and wants it. Failures have been logged and raised; the
// event is then lost here.
void diag_add_event(const char* package, const char* name, std::span<const char> payload);

// Whether events of that name can be wanted. False while the store is switched on by a value other
// than 1.
[[nodiscard]] bool diag_wants_probe(const char* package, const char* name);

// Bytes that have to stay free on the file system for it.
[[nodiscard]] uint32_t diag_space_reserve();

// Waits until no compressor runs.
void diag_wait_for_compressor();

// Waits likewise and makes the store inactive; its files stay.
void diag_release();

}  // namespace kivd
