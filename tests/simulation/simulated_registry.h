#pragma once

#include "platform/simulated/simulated_platform.h"

#include <cstddef>
#include <map>
#include <set>
#include <string>
#include <utility>
#include <vector>

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

    /// Takes over what was on the disk of another device, with its past, and writes it.
    void continueFrom(const SimulatedRegistry& other);

    /// The path of some font, installed or not.
    std::string somePath();

    /// The fonts that a client may see now, if it may see any.
    std::set<std::string> enabled() const;
    /// The fonts that were to be seen at some time so far.
    const std::set<std::string>& everEnabled() const { return everEnabled_; }

    /// The families that some font ever had, and the face names, none of which says which family it is in.
    static const std::vector<std::string>& familyNames();
    static const std::vector<std::string>& postScriptNames();
    /// The families that the face was ever in.
    static std::set<std::string> familiesOf(const std::string& postScriptName);
    /// Whether the font ever had a face of that family while it was enabled, or while it was disabled.
    bool wasEnabledWith(const std::string& path, const std::string& family) const
    {
        return everEnabledWith_.contains({path, family});
    }
    bool wasDisabledWith(const std::string& path, const std::string& family) const
    {
        return everDisabledWith_.contains({path, family});
    }

private:
    enum class State { enabled, enabledWithKey, disabled, notADictionary, wrongDisabled, wrongFamilyName };

    struct Font {
        State state;
        /// Which of the sets of faces it has.
        std::size_t faces;
    };

    static PropertyList entryOf(const Font& font);
    void remember(const std::string& path, const Font& font);
    void write();

    SimulatedPlatform& simulated_;
    std::map<std::string, Font> fonts_;
    bool isUnreadable_ = false;
    std::set<std::string> everEnabled_;
    std::set<std::pair<std::string, std::string>> everEnabledWith_;
    std::set<std::pair<std::string, std::string>> everDisabledWith_;
};

}  // namespace typhon::simulation
