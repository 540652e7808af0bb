// The commands of kivctl as a table: how the command line shows each one, and what runs it.
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

    // Options before the command.
    std::string base = KIV_DEFAULT_DIRECTORY;
    unsigned timeout_ms = 2000;
};

struct argument {
    const char* name = nullptr;  // an option when it starts with dashes
    std::string given::*target = nullptr;
    const char* description = nullptr;
    bool is_required = false;
    // Returns a complaint, or an empty text when all is well. May be null.
    std::string (*check)(const std::string&) = nullptr;
    const char* value_name = nullptr;  // of an option
    bool given::*flag = nullptr;       // in place of `target`, for an option without a value
};

enum class handle_use : bool { none, needed };

struct command {
    const char* group;  // null for none
    const char* name;
    const char* description;
    argument arguments[4];  // unused ones have no name
    // Returns the exit status, or the error of libkiv.
    int (*run)(kiv_handle*, const given&);
    handle_use handle = handle_use::needed;  // none: `run` gets a null handle
};

struct command_group {
    const char* name;
    const char* description;
};

[[nodiscard]] std::span<const command_group> kivctl_groups();
[[nodiscard]] std::span<const command> kivctl_commands();

}  // namespace kivd
