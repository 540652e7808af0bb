// The option `--verify-config`.
#pragma once

namespace kivd {

// Checks a file against the signature in the file of the same name with ".sig" appended, prints
// "Verified: OK" or "Verified: Failure", and returns whether the signature holds.
[[nodiscard]] bool verify_config_command(const char* path);

}  // namespace kivd
