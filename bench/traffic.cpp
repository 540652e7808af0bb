#include "bench/traffic.h"

#include <cstdio>
#include <iterator>
#include <random>

namespace kivd {
namespace {

// The lengths of these tables have no divisor in common, so each kind comes in each size.
constexpr std::string_view kinds[] = {"EV", "EV", "CI", "EV", "SD", "EV", "EV", "CS",
                                      "EV", "EV", "CI", "IA", "EV", "SD", "EV", "CI"};
constexpr size_t payload_sizes[] = {0, 1, 9, 17, 40, 64, 64, 130, 250, 700, 1400};
constexpr uint64_t largest_every = 511;
constexpr uint64_t shared_counters = 15;
constexpr size_t starts = 1024;       // of payloads in the text below
constexpr size_t longest = 1U << 18;  // that a check may ask for

std::string letters(size_t start, size_t size) {
    static const std::string all = [] {
        std::string text;
        std::minstd_rand random(1);
        while (text.size() < starts + longest) text += static_cast<char>('a' + random() % 26);
        return text;
    }();
    return all.substr(start, size);
}

size_t payload_size(event_id id) {
    if ((id.client + id.number) % largest_every == 0) return largest_payload;
    return payload_sizes[id.number % std::size(payload_sizes)];
}

struct package_parts {
    event_id id;
    size_t size;
};

std::optional<package_parts> split(const std::string& package) {
    package_parts parts = {};
    const int found =
        sscanf(package.c_str(), "%zu.%lu.%zu.", &parts.id.client, &parts.id.number, &parts.size);
    return found == 3 ? std::optional(parts) : std::nullopt;
}

std::string counter_of(event_id id) {
    return "shared." + std::to_string(id.number % shared_counters);
}
int amount_of(event_id id) { return static_cast<int>(id.number % 7) - 2; }
std::string text_of(event_id id) { return letters(id.number % 64, 1 + id.number % 200); }

}  // namespace

std::string event_package(event_id id, size_t payload_size) {
    return std::to_string(id.client) + "." + std::to_string(id.number) + "." +
           std::to_string(payload_size) + ".";
}

std::string payload_of(event_id id, size_t size) {
    return letters((id.client + id.number) % starts, size);
}

std::optional<event_id> find_event_id(const std::string& package) {
    const std::optional<package_parts> parts = split(package);
    return parts ? std::optional(parts->id) : std::nullopt;
}

bool is_intact(const std::string& package, std::string_view payload) {
    const std::optional<package_parts> parts = split(package);
    return parts && payload == payload_of(parts->id, parts->size);
}

std::string_view kind_of(event_id id) { return kinds[(id.client + id.number) % std::size(kinds)]; }

message make_message(event_id id) {
    const std::string_view kind = kind_of(id);
    const std::string own_name = std::to_string(id.client);
    if (kind == "EV") {
        const size_t size = payload_size(id);
        return {kind, event_package(id, size), "sent", payload_of(id, size)};
    }
    if (kind == "CI") return {kind, load_package, counter_of(id), std::to_string(amount_of(id))};
    if (kind == "CS") return {kind, load_package, own_name, std::to_string(id.number)};
    if (kind == "SD") return {kind, load_package, own_name, text_of(id)};
    return {kind, "", "", ""};
}

std::string request_of(const message& sent) {
    std::string request(sent.kind);
    if (sent.package.empty()) return request;
    for (const std::string* part : {&sent.package, &sent.name, &sent.value}) {
        request.append(" ").append(*part);
    }
    return request;
}

probe_values values_after(std::span<const uint64_t> counts) {
    probe_values values;
    for (size_t client = 0; client < counts.size(); ++client) {
        const std::string name = std::to_string(client);
        for (event_id id = {client, 0}; id.number < counts[client]; ++id.number) {
            const std::string_view kind = kind_of(id);
            if (kind == "CI") values.counters[counter_of(id)] += amount_of(id);
            if (kind == "CS") values.counters[name] = static_cast<int64_t>(id.number);
            if (kind == "SD") values.texts[name] = text_of(id);
        }
    }
    return values;
}

}  // namespace kivd
