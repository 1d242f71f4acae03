#pragma once

#include "simulation/daemon_simulation.h"

#include <cstdint>

namespace typhon::simulation {

/// Runs the deletion schedule on a device whose daemon restarts and whose wall clock is stepped forwards and
/// backwards, also by days, while clients schedule files and hostile paths and its disk fails at times.
/// Everything follows from the seed.
Findings simulateDeletion(std::uint64_t seed);

}  // namespace typhon::simulation
