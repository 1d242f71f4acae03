#pragma once

#include "deletion/scheduled_font_deletion.h"
#include "platform/simulated/simulated_platform.h"

#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>

namespace typhon::test {

inline const std::string fontFiles = "/var/mobile/Library/UserFonts/FontFiles/";
inline const std::string fontAssets = "/var/mobile/Library/UserFonts/FontAssets/";
inline const std::string assetStore = "/private/var/Cargon/AssetsV2/com_vorlan_Cargon_Font7/";

/// A simulated device with a deletion schedule.
class DeletionTest : public testing::Test {
protected:
    using Dictionary = PropertyList::Dictionary;

    std::shared_ptr<ScheduledFontDeletion> makeDeletion()
    {
        return std::make_shared<ScheduledFontDeletion>(simulated.platform, [this] { ++sweeps; });
    }
    /// The daemon ends at once and starts again.
    void restart()
    {
        deletion.reset();
        simulated.preferences.restart();
        simulated.drain();
        deletion = makeDeletion();
        deletion->setupForScheduledFontDeletion();
        simulated.drain();
    }

    void schedule(std::vector<std::string> paths)
    {
        simulated.run(deletion->scheduleFontFilesDeletion(std::move(paths)));
    }
    /// Puts a file there and gives its path.
    std::string file(const std::string& path)
    {
        simulated.fileSystem.addFile(path, PropertyList());
        return path;
    }
    bool exists(const std::string& path) { return simulated.fileSystem.exists(path); }
    void setDelay(PropertyList delay)
    {
        simulated.preferences.changeFromOutside("deleteDelay", std::move(delay));
    }
    void setSchedule(Dictionary entries)
    {
        simulated.preferences.changeFromOutside("delete", std::move(entries));
    }
    Dictionary scheduled() const
    {
        const auto value = simulated.preferences.durableValue("delete");
        return value ? *value->asDictionary() : Dictionary{};
    }
    /// Seconds from now until that path is due.
    double remaining(const std::string& path) const
    {
        return scheduled().at(path).asDate()->seconds - simulated.clock.now();
    }
    PropertyList dueIn(double seconds) const { return Date{simulated.clock.now() + seconds}; }
    void advance(double seconds)
    {
        simulated.scheduler.advance(
            std::chrono::duration_cast<std::chrono::nanoseconds>(std::chrono::duration<double>(seconds)));
    }
    std::size_t passes() const
    {
        return simulated.log.count(LogSink::daemon, LogLevel::debug, "executeScheduledFontFilesDeletion");
    }
    bool hasLogged(LogLevel level, const std::string& message) const
    {
        return simulated.log.contains(LogSink::daemon, level, message);
    }

    SimulatedPlatform simulated;
    unsigned sweeps = 0;
    std::shared_ptr<ScheduledFontDeletion> deletion = makeDeletion();
};

}  // namespace typhon::test
