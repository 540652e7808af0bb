#include "bench/configuration.h"

#include <zlib.h>

#include <cstdio>
#include <utility>

#include "bench/measure.h"

namespace kivd::bench {

namespace {

constexpr unsigned names_per_package = 50;
constexpr int gzip_window_bits = 15 + 16;
constexpr int highest_memory_level = 9;

std::string package_name(unsigned number) {
    static constexpr const char* vendors[] = {"example", "northwind", "acme", "lumen", "orchard"};
    static constexpr const char* apps[] = {"camera",  "contacts", "music", "settings",
                                           "gallery", "calendar", "maps",  "browser"};
    char text[64];
    (void)snprintf(text, sizeof text, "com.%s.%s%u", vendors[number % 5], apps[number / 5 % 8],
                   number / 40);
    return text;
}

std::string probe_name(unsigned number) {
    static constexpr const char* things[] = {"button", "screen", "battery", "network", "storage"};
    static constexpr const char* facts[] = {"pressed", "shown",   "level", "failed", "opened",
                                            "closed",  "latency", "size",  "count",  "restarted"};
    return std::string(things[number % 5]) + "_" + facts[number / 5 % 10];
}

}  // namespace

std::vector<probe> make_probes(unsigned count) {
    std::vector<probe> probes;
    for (unsigned i = 0; i < count; ++i)
        probes.push_back({package_name(i / names_per_package), probe_name(i % names_per_package)});
    return probes;
}

std::string pack_event_filter(kiv::config::Filter::Type type, const std::vector<probe>& probes) {
    kiv::config::FilterConfig config;
    config.mutable_event_filter()->set_type(type);
    for (const probe& each : probes) {
        kiv::config::FilterItem& item = *config.mutable_event_filter()->add_item();
        item.set_package(each.package);
        item.set_name(each.name);
    }
    return config.SerializeAsString();
}

kiv::config::ConfigPackage make_filter_package(std::string filter_config) {
    kiv::config::ConfigPackage package;
    kiv::config::ConfigPart& part = *package.add_parts();
    part.set_package("kivd");
    part.set_name("FilterConfig");
    part.set_payload(std::move(filter_config));
    return package;
}

std::string compress(const kiv::config::ConfigPackage& package) {
    std::string bytes = package.SerializeAsString();
    z_stream stream{};
    // Level 1: the others spend more bytes on texts that count through their letters.
    (void)deflateInit2(&stream, Z_BEST_SPEED, Z_DEFLATED, gzip_window_bits, highest_memory_level,
                       Z_DEFAULT_STRATEGY);
    std::string packed(deflateBound(&stream, bytes.size()), '\0');
    stream.next_in = reinterpret_cast<Bytef*>(bytes.data());
    stream.avail_in = static_cast<uInt>(bytes.size());
    stream.next_out = reinterpret_cast<Bytef*>(packed.data());
    stream.avail_out = static_cast<uInt>(packed.size());
    if (deflate(&stream, Z_FINISH) != Z_STREAM_END) give_up("deflate failed");
    packed.resize(stream.total_out);
    (void)deflateEnd(&stream);
    return packed;
}

std::string make_config_file(std::string compressed, std::string signature) {
    kiv::config::ConfigResponse file;
    if (!signature.empty()) file.set_signature(std::move(signature));
    file.set_compressed_data(std::move(compressed));
    return file.SerializeAsString();
}

}  // namespace kivd::bench
