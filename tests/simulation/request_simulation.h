#pragma once

#include "simulation/daemon_simulation.h"

#include <cstdint>

namespace typhon::simulation {

/// Runs the daemon with applications that ask for fonts, again and again, with a user who answers dialogs or
/// not, twice or with nonsense, and with fonts that change meanwhile. Everything follows from the seed.
Findings simulateRequests(std::uint64_t seed, Defect defect = Defect::none);

}  // namespace typhon::simulation
