#pragma once

#include "platform/simulated/simulated_platform.h"
#include "registry/user_font_registry.h"

namespace typhon::bench {

/// A sample registry that was read, on a device that is simulated but for the work that is measured.
class LoadedRegistry {
public:
    /// `fonts` is the number of registered font files.
    explicit LoadedRegistry(int fonts);

    SimulatedPlatform& device() { return simulated_; }
    UserFontRegistry& registry() { return registry_; }
    /// Reads it, if it was invalidated.
    void load();

private:
    SimulatedPlatform simulated_;
    UserFontUpdates updates_{simulated_.platform.processWideQueues};
    UserFontRegistry registry_{simulated_.fileSystem, simulated_.log, updates_};
};

}  // namespace typhon::bench
