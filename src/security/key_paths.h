// The two public keys of the device: where they are, and reading them. A protection is off only
// while its key file is absent or not ours to read; a file that cannot be looked at for any other
// reason counts as there, so that what needs it fails. The files are read anew for each use, so
// that a replaced one takes effect without a restart.
#pragma once

#include "security/crypto_module.h"

namespace kivd {

// Has both keys looked for in the system's own directory for them.
void set_default_key_paths();

// The key is the file of its name in `directory`, which has to end in "/": none is added. Paths
// longer than 4095 characters are cut.
void set_report_key_dir(const char* directory);
void set_config_key_dir(const char* directory);

// Without a path, reports are not sealed and configurations not verified.
void clear_report_key_path();
void clear_config_key_path();

// Whether the protection is on.
[[nodiscard]] bool is_sealing_on();
[[nodiscard]] bool is_verification_on();

// The public key in the key file, in PEM; null when the file cannot be read or holds
// none, or the module for keys cannot be loaded, which has been logged and raised.
[[nodiscard]] crypto_key load_report_key();
[[nodiscard]] crypto_key load_config_key();

}  // namespace kivd
