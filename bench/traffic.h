// What clients send to a daemon under load. All of it follows from the client's number and the
// message's, so whoever checks what has become of it only needs to know how far each client came.
#pragma once

#include <compare>
#include <cstddef>
#include <cstdint>
#include <map>
#include <optional>
#include <span>
#include <string>
#include <string_view>

namespace kivd {

// Who sent an event, and the how manieth message it was.
struct event_id {
    size_t client;
    uint64_t number;
    auto operator<=>(const event_id&) const = default;
};

// An event's package is "CLIENT.NUMBER.SIZE.", with more behind it where somebody looks for that,
// so it shows by itself which payload it was sent with.
inline constexpr size_t largest_payload = 30720;
[[nodiscard]] std::string event_package(event_id id, size_t payload_size);
[[nodiscard]] std::string payload_of(event_id id, size_t size);
// None for events that were not sent by this traffic.
[[nodiscard]] std::optional<event_id> find_event_id(const std::string& package);
// Whether it has the payload that it was sent with.
[[nodiscard]] bool is_intact(const std::string& package, std::string_view payload);

struct message {
    std::string_view kind;  // EV, CI, CS, SD, IA
    std::string package;    // empty for IA, like what follows
    std::string name;
    std::string value;  // or payload
};
[[nodiscard]] std::string_view kind_of(event_id id);
[[nodiscard]] message make_message(event_id id);
// The request as it is sent.
[[nodiscard]] std::string request_of(const message& sent);

// The values of counters and static data, by name; their package is "load".
inline constexpr char load_package[] = "load";
struct probe_values {
    std::map<std::string, int64_t> counters;
    std::map<std::string, std::string> texts;
    bool operator==(const probe_values&) const = default;
};
// What holds when `counts[client]` messages of each client have been carried out.
[[nodiscard]] probe_values values_after(std::span<const uint64_t> counts);

}  // namespace kivd
