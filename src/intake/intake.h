// Taking a new configuration: from input/config to the parts in force. Format of the file:
// docs/configuration.md.
#pragma once

#include <cstdint>
#include <span>

namespace kivd {

// Replaces input/config. Failures have been logged and raised.
void replace_config_file(std::span<const char> bytes);

// Copies the system's first configuration to input/config unless there is one. Failures have been
// logged.
void install_first_configuration();

// Makes the parts of a configuration file those in force, without anything else following them yet.
// False when it was refused, which has been logged and raised.
[[nodiscard]] bool store_configuration(std::span<const uint8_t> file);

// Takes input/config and puts it in force: settings, report header, filters, actions. False when
// there is none, or when it was refused, which has been logged and raised; what was in force then
// stays in force. input/ is empty afterwards, but for directories: nothing is deleted recursively.
// Others write there, so input/config may be anything: a pipe counts as empty, a directory as none.
bool take_new_configuration();

}  // namespace kivd
