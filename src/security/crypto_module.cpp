#include "security/crypto_module.h"

#include <dlfcn.h>

#include <cstring>

#include "runtime/log_and_raise.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd/crypto";
constexpr char module_name[] = "kivd-crypto.so";  // in the run path of the program

constinit const crypto_functions* crypto = nullptr;

}  // namespace

const crypto_functions* get_crypto() {
    if (crypto != nullptr) return crypto;
    void* const module = dlopen(module_name, RTLD_NOW | RTLD_LOCAL);
    const void* const found = module != nullptr ? dlsym(module, crypto_symbol) : nullptr;
    if (found == nullptr) {
        log_and_raise(tag, "Failed to load the module for keys: %s", dlerror());
        return nullptr;
    }
    const auto* const functions = static_cast<const crypto_functions*>(found);
    // After an upgrade the module is another daemon's.
    if (strcmp(functions->version, KIV_VERSION) != 0) {
        log_and_raise(tag, "Failed to load the module for keys: %s is of version %s", module_name,
                      functions->version);
        return nullptr;
    }
    crypto = functions;
    return crypto;
}

}  // namespace kivd
