#pragma once

#include "platform/simulated/simulated_platform.h"

#include <map>
#include <set>
#include <string>

namespace typhon::simulation {

/// The registry file of a simulated device, as the font-registry library would write it, and as a hostile
/// or broken one might.
class SimulatedRegistry {
public:
    explicit SimulatedRegistry(SimulatedPlatform& simulated) : simulated_(simulated) {}

    /// Installs, removes, enables, disables or spoils a font, or the file as a whole, and writes the file.
    void changeSomething();
    /// Makes the file readable again, if it is not.
    void repair();

    /// The path of some font, installed or not.
    std::string somePath();

    /// The fonts that a client may see now, if it may see any.
    std::set<std::string> enabled() const;
    /// The fonts that were to be seen at some time so far.
    const std::set<std::string>& everEnabled() const { return everEnabled_; }

private:
    enum class State { enabled, enabledWithKey, disabled, notADictionary, wrongDisabled, wrongFamilyName };

    void write();

    SimulatedPlatform& simulated_;
    std::map<std::string, State> fonts_;
    bool isUnreadable_ = false;
    std::set<std::string> everEnabled_;
};

}  // namespace typhon::simulation
