#pragma once

#include "platform/font_directories.h"
#include "simulation/world.h"

#include <algorithm>
#include <map>
#include <set>
#include <string>
#include <utility>

namespace typhon::simulation {

/// What applications asked for and what the user chose, to judge by it what they get.
struct RequestHistory {
    /// By the identifier that a signature gives.
    std::map<std::string, std::set<std::string>> familiesAskedFor;
    /// Family and provider.
    std::set<std::pair<std::string, std::string>> chosen;

    /// Whether asking for those families could ever have given that file. The user may choose a file that was
    /// not asked for.
    bool mayGive(const SimulatedRegistry& registry, const std::set<std::string>& families,
                 const std::string& path) const
    {
        return wasSwitchedOn(registry, path) || std::ranges::any_of(families, [&](const std::string& family) {
                   return registry.wasEnabledWith(path, family);
               });
    }

private:
    /// Whether the user chose the application that holds the file for any family of the file.
    bool wasSwitchedOn(const SimulatedRegistry& registry, const std::string& path) const
    {
        const std::string provider(font_directories::nameOfDirectoryHolding(path));
        return std::ranges::any_of(SimulatedRegistry::familyNames(), [&](const std::string& family) {
            return registry.wasDisabledWith(path, family) && chosen.contains({family, provider});
        });
    }
};

}  // namespace typhon::simulation
