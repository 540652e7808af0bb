// The parts of the configuration in force: each is a file of its own, private/conf_ID.bin, and the
// configuration list says which package and name has which id. A part that leaves the configuration
// keeps its place in the list and its id, which no other part ever gets.
#pragma once

#include <optional>
#include <span>

#include "util/file_io.h"
#include "util/protobuf_message.h"
#include "util/unique_fd.h"

namespace kivd {

// Loads private/config_list.txt; a missing file is fine. Parts that share an id or a name, as a
// damaged list may have them, are dropped, since nobody knows whose payload it is.
void load_config_list();
void release_config_list();

// A read-only descriptor of a part in force; not ok when there is none.
[[nodiscard]] unique_fd get_config_fd(const char* package, const char* name);

// What one of the daemon's own parts, those of package "kivd", holds; nothing when it is not in
// force or cannot be read.
[[nodiscard]] std::optional<file_bytes> read_own_part(const char* name);

// The same as the message of the two generated functions; null as well when it cannot be decoded.
template <auto unpack, auto free_unpacked>
[[nodiscard]] auto unpack_own_part(const char* name) {
    const std::optional<file_bytes> part = read_own_part(name);
    using unique_message = decltype(unpack_message<unpack, free_unpacked>({}));
    return part ? unpack_message<unpack, free_unpacked>(part->view()) : unique_message();
}

// The steps of taking a new configuration: nothing is in force, then each of the new parts is put
// in force, the list is saved, and the files of all others go. A part that cannot be stored or has
// the reserved name kivd:_last_id is left out; what failed has been logged and raised, but for a
// file that could not be created.
void retire_config_parts();
void store_config_part(const char* package, const char* name, std::span<const uint8_t> payload);
[[nodiscard]] bool save_config_list();
void delete_retired_parts();

// Takes one of the daemon's own parts out of force until the next configuration.
void retire_own_part(const char* name);

}  // namespace kivd
