// The commands of kivctl, as data: what the command line shows of each, and what carries it out.
#pragma once

#include <span>
#include <string>

#include "kiv.h"

namespace kivd {

// What the command line gave; each command uses a few.
struct given {
    std::string package;
    std::string name;
    std::string value;
    std::string payload;
    std::string file;
    std::string amount = "1";
    std::string state;
    std::string number;
    std::string id;
    std::string old_id;
    std::string output;
    std::string host = "127.0.0.1";
    bool is_raw = false;
    bool is_json = false;
    std::string key_directory;
    std::string user;

    // options before the command
    std::string base = KIV_DEFAULT_DIRECTORY;
    unsigned timeout_ms = 2000;
};

struct argument {
    const char* name = nullptr;  // an option when it starts with dashes
    std::string given::*target = nullptr;
    const char* description = nullptr;
    bool is_required = false;
    // Gives a complaint, empty when all is well; or null.
    std::string (*check)(const std::string&) = nullptr;
    const char* value_name = nullptr;  // of an option
    bool given::*flag = nullptr;       // in place of `target`, for an option without a value
};

enum class handle_use : bool { none, needed };

struct command {
    const char* group;  // null for none
    const char* name;
    const char* description;
    argument arguments[4];  // the last ones nameless
    // Gives the exit status, or what libkiv gave when it failed.
    int (*run)(kiv_handle*, const given&);
    handle_use handle = handle_use::needed;  // none: that of `run` is null
};

struct command_group {
    const char* name;
    const char* description;
};

[[nodiscard]] std::span<const command_group> kivctl_groups();
[[nodiscard]] std::span<const command> kivctl_commands();

}  // namespace kivd
