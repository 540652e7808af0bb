// Configurations and what is in them.
#pragma once

#include <string>
#include <vector>

#include "config.pb.h"

namespace kivd::bench {

struct probe {
    std::string package;
    std::string name;
};

// Probes named as applications name theirs: some fifty to a package.
[[nodiscard]] std::vector<probe> make_probes(unsigned count);

// The packed FilterConfig of a filter for events.
[[nodiscard]] std::string pack_event_filter(kiv::config::Filter::Type type,
                                            const std::vector<probe>& probes);

// A package whose only part is that FilterConfig.
[[nodiscard]] kiv::config::ConfigPackage make_filter_package(std::string filter_config);

// What stands compressed in the configuration file, and the file.
[[nodiscard]] std::string compress(const kiv::config::ConfigPackage& package);
[[nodiscard]] std::string make_config_file(std::string compressed, std::string signature);

}  // namespace kivd::bench
