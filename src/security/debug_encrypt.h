// The option `--encrypt`.
#pragma once

namespace kivd {

// Seals a file into three beside it: the ciphertext (".enc"), the IV (".iv") and the encrypted key
// (".key"). Stops, having said why, when the file or the report key cannot be opened; an output
// file that cannot be created is left out.
void debug_encrypt(const char* path);

}  // namespace kivd
