#pragma once

#include "platform/ServiceRegistry.h"

#include <algorithm>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace support {

/// A registry with one entry, which can be taken away, and a record of what was asked.
class ScriptedRegistry : public platform::ServiceRegistry {
  public:
    static constexpr platform::ServiceHandle kEntry = 77;

    bool present = true;
    std::map<std::string, std::vector<std::uint8_t>, std::less<>> properties;

    std::vector<std::string> pathsAsked;
    std::vector<std::string> classesAsked;
    /// References that were handed out and not given back.
    int held = 0;
    int releases = 0;

    platform::ServiceHandle findByPath(std::string_view path) override {
        pathsAsked.emplace_back(path);
        return handOut();
    }

    platform::ServiceHandle findByClassName(std::string_view name) override {
        classesAsked.emplace_back(name);
        return handOut();
    }

    std::optional<std::vector<std::uint8_t>> copyProperty(platform::ServiceHandle entry,
                                                          std::string_view name) override {
        const auto found = properties.find(name);
        if (entry != kEntry || found == properties.end()) {
            return std::nullopt;
        }
        return found->second;
    }

    void release(platform::ServiceHandle entry) override {
        ++releases;
        if (entry == kEntry) {
            --held;
        }
    }

  private:
    platform::ServiceHandle handOut() {
        if (!present) {
            return platform::kNoService;
        }
        ++held;
        return kEntry;
    }
};

} // namespace support
