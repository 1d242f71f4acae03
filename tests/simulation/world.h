#pragma once

#include "daemon/typhon_daemon.h"
#include "platform/simulated/simulated_platform.h"
#include "simulation/simulated_registry.h"

#include <cstdint>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <vector>

namespace typhon::simulation {

/// A simulated device with its daemon, and what must be remembered of its past to judge the daemon by.
struct World {
    explicit World(std::uint64_t seed) : simulated(seed)
    {
        using Array = PropertyList::Array;
        using Dictionary = PropertyList::Dictionary;
        simulated.applicationRegistry.install({"com.example.barred", "1.0", false});
        simulated.applicationRegistry.install({"com.example.editor", "1.0", false});
        daemon->clientCapabilities().setFontEnumerationProhibitedInfo(
            Array{Dictionary{{"com.example.barred", Array{"0.9", "1.0"}}},
                  Dictionary{{"com.example.editor", Array{"1.1"}}}});
    }

    void report(const std::string& who, const std::string& violation)
    {
        violations.push_back(who + ": " + violation);
    }

    SimulatedPlatform simulated;
    SimulatedRegistry registry{simulated};
    std::shared_ptr<TyphonDaemon> daemon = std::make_shared<TyphonDaemon>(simulated.platform);
    /// The paths that were ever to be recorded for an application.
    std::map<std::string, std::set<std::string>> everIssued;
    std::vector<std::string> violations;
};

}  // namespace typhon::simulation
