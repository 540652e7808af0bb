// Keeps a value for each probe in reports. Takes bounded memory, whatever the reports hold.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <functional>
#include <string>
#include <string_view>
#include <unordered_map>

namespace kivd {

inline constexpr size_t max_table_probes = 50'000;
inline constexpr size_t max_table_text = size_t{8} << 20;  // bytes, of packages and names

template <class value>
class probe_table {
 public:
    // The value of the probe, a new one if need be; null when there is no room for another probe.
    value* find_or_add(std::string_view package, std::string_view name) {
        const auto package_size = static_cast<uint32_t>(package.size());
        key_.assign(reinterpret_cast<const char*>(&package_size), sizeof package_size);
        key_ += package;
        key_ += name;
        const auto found = entries_.find(key_);
        if (found != entries_.end()) return &found->second;
        if (entries_.size() == max_table_probes || text_size_ + key_.size() > max_table_text) {
            return nullptr;
        }
        text_size_ += key_.size();
        return &entries_.try_emplace(key_).first->second;
    }

    [[nodiscard]] size_t size() const { return entries_.size(); }

    // Calls `function` with package, name and value, in no particular order.
    void for_each(auto function) const {
        for (const auto& [key, kept] : entries_) {
            uint32_t package_size = 0;
            memcpy(&package_size, key.data(), sizeof package_size);
            const std::string_view texts = std::string_view(key).substr(sizeof package_size);
            function(texts.substr(0, package_size), texts.substr(package_size), kept);
        }
    }

 private:
    std::unordered_map<std::string, value> entries_;
    size_t text_size_ = 0;
    std::string key_;  // of the last lookup; avoids allocating
};

}  // namespace kivd
