#pragma once

#include "simulation/defects.h"

#include <cstdint>
#include <string>
#include <vector>

namespace typhon::simulation {

/// What one run showed.
struct Findings {
    /// Everything that must not happen; empty for a sound daemon.
    std::vector<std::string> violations;
    /// The whole log of the run: the same seed gives the same.
    std::string log;
};

/// Runs the daemon with several clients of all kinds on a device that changes under them; some daemons are
/// killed and started again on what is left on the disk. Everything follows from the seed.
Findings simulateDaemon(std::uint64_t seed, Defect defect = Defect::none);

}  // namespace typhon::simulation
