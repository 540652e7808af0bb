// What each client sends. All of it follows from the client's number and the message's, so whoever
// checks what has become of it only needs to know how far each client has come.
#pragma once

#include <array>
#include <cstdint>
#include <map>
#include <random>
#include <string>

namespace kivd::soak {

inline constexpr int connection_count = 500;
inline constexpr int producer_count = 8;
inline constexpr int client_count = connection_count + producer_count;  // producers come last
using message_counts = std::array<uint64_t, client_count>;

// The lengths of these tables have no divisor in common, so each kind comes in each size.
inline constexpr std::string_view kinds[] = {"EV", "EV", "CI", "EV", "SD", "EV", "EV", "CS",
                                             "EV", "EV", "CI", "IA", "EV", "SD", "EV", "CI"};
inline constexpr size_t payload_sizes[] = {0, 1, 9, 17, 40, 64, 64, 130, 250, 700, 1400};
inline constexpr size_t largest_payload = 30720;
inline constexpr uint64_t largest_every = 511;
inline constexpr uint64_t shared_counters = 15;

struct message {
    std::string_view kind;
    std::string name;   // of package "soak"; an event's is "CLIENT.NUMBER"
    std::string value;  // or payload
};

inline std::string_view kind_of(int client, uint64_t number) {
    return kinds[(number + static_cast<uint64_t>(client)) % std::size(kinds)];
}

inline uint64_t next_event(int client, uint64_t number) {
    while (kind_of(client, number) != "EV") ++number;
    return number;
}

inline std::string letters(size_t start, size_t size) {
    static const std::string all = [] {
        std::string text;
        std::minstd_rand random(1);
        while (text.size() < 2 * largest_payload) text += static_cast<char>('a' + random() % 26);
        return text;
    }();
    return all.substr(start, size);
}

inline std::string payload_of(int client, uint64_t number) {
    const uint64_t mixed = number + static_cast<uint64_t>(client);
    // A producer's first ones have the daemon use its buffers as far as they go.
    const bool is_largest =
        mixed % largest_every == 0 || (client >= connection_count && number < 100);
    return letters(mixed % 1024,
                   is_largest ? largest_payload : payload_sizes[number % std::size(payload_sizes)]);
}

inline std::string text_of(uint64_t number) { return letters(number % 64, 1 + number % 200); }
inline int amount_of(uint64_t number) { return static_cast<int>(number % 7) - 2; }
inline std::string shared_counter(uint64_t number) {
    return "shared." + std::to_string(number % shared_counters);
}

inline message make_message(int client, uint64_t number) {
    const std::string_view kind = kind_of(client, number);
    const std::string own_name = std::to_string(client);
    if (kind == "EV") {
        return {kind, own_name + "." + std::to_string(number), payload_of(client, number)};
    }
    if (kind == "CI") return {kind, shared_counter(number), std::to_string(amount_of(number))};
    if (kind == "CS") return {kind, own_name, std::to_string(number)};
    if (kind == "SD") return {kind, own_name, text_of(number)};
    return {kind, "", ""};
}

// By name.
struct probe_values {
    std::map<std::string, int64_t> counters;
    std::map<std::string, std::string> texts;
};

// What holds when of each client that many messages have been carried out.
inline probe_values values_after(const message_counts& counts) {
    probe_values values;
    for (int client = 0; client < client_count; ++client) {
        const std::string name = std::to_string(client);
        for (uint64_t number = 0; number < counts[static_cast<size_t>(client)]; ++number) {
            const std::string_view kind = kind_of(client, number);
            if (kind == "CI") values.counters[shared_counter(number)] += amount_of(number);
            if (kind == "CS") values.counters[name] = static_cast<int64_t>(number);
            if (kind == "SD") values.texts[name] = text_of(number);
        }
    }
    return values;
}

}  // namespace kivd::soak
