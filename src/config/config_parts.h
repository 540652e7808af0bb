// The parts of the configuration in force: each is a file of its own, private/conf_ID.bin, and the
// configuration list says which package and name has which id. A part that leaves the configuration
// keeps its place in the list and its id, which no other part ever gets.
#pragma once

#include <optional>
#include <span>

#include "config.pb-c.h"
#include "format/protobuf_message.h"
#include "util/file_io.h"
#include "util/unique_fd.h"

namespace kivd {

inline constexpr char own_package[] = "kivd";

// Loads private/config_list.txt; a missing file is fine. Parts that share an id or a name, as a
// damaged list may have them, are dropped, since nobody knows whose payload it is.
void load_config_list();
void release_config_list();

// A read-only descriptor of a part in force; not ok when there is none.
[[nodiscard]] unique_fd get_config_fd(const char* package, const char* name);

// What one of the daemon's own parts, those of package "kivd", holds; nothing when it is not in
// force or cannot be read.
[[nodiscard]] std::optional<file_bytes> read_own_part(const char* name);

// The same as a message of that type, whose C struct is `message`; null as well when it cannot be
// decoded.
template <class message>
[[nodiscard]] unique_message<message> unpack_own_part(const ProtobufCMessageDescriptor& type,
                                                      const char* name) {
    const std::optional<file_bytes> part = read_own_part(name);
    return part ? unpack_message<message>(type, part->view()) : nullptr;
}

// Whether these can be the parts of a configuration: there is room for so many in the list, copies
// counted, and for each package and name in a record. If not, that has been logged and raised.
using new_parts = std::span<const Kiv__Config__ConfigPart* const>;
[[nodiscard]] bool can_hold_parts(new_parts parts);

// The steps of taking a new configuration of such parts: nothing is in force, then each of them is
// put in force, the list is saved, and the files of all others go. While there is no room for all,
// those that left earlier lose their places. A part that cannot be stored or has the reserved name
// kivd:_last_id is left out; what failed has been logged and raised.
void retire_config_parts(new_parts next);
void store_config_part(const char* package, const char* name, std::span<const uint8_t> payload);
[[nodiscard]] bool save_config_list();
void delete_retired_parts();

// Takes one of the daemon's own parts out of force until the next configuration.
void retire_own_part(const char* name);

}  // namespace kivd
