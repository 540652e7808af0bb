// Asks a daemon several questions within one time limit.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "kiv.h"
#include "kivctl/io.h"
#include "util/releaser.h"

namespace kivd {

struct config_part_answer {
    bool is_known = false;
    std::optional<std::string> payload;  // missing when the configuration in force has no such part
};

class daemon_questions {
 public:
    // Asks the daemon of the current directory.
    explicit daemon_questions(unsigned timeout_ms);

    // 0 when it answers, else the error of libkiv. Once there was none, nothing more is asked.
    [[nodiscard]] int is_alive();
    [[nodiscard]] std::optional<bool> is_wanted(const char* package, const char* name);
    // A part of the package "kivd".
    [[nodiscard]] config_part_answer own_part(const char* name);

 private:
    kiv_handle* next();

    deadline end_;
    int last_ = 0;
    std::unique_ptr<kiv_handle, releaser<kiv_destroy>> daemon_;
};

}  // namespace kivd
