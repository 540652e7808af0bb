#include "security/verify_config_command.h"

#include <cstdio>

#include "security/signature.h"

namespace kivd {

bool verify_config_command(const char* path) {
    char signature_path[4097];
    snprintf(signature_path, sizeof signature_path, "%s.sig", path);
    const bool holds = verify_file(path, signature_path);
    printf("Verified: %s\n", holds ? "OK" : "Failure");
    return holds;
}

}  // namespace kivd
