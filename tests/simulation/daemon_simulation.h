#pragma once

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

/// Runs the daemon with several clients of all kinds on a device that changes under them. Everything
/// follows from the seed.
Findings simulateDaemon(std::uint64_t seed);

}  // namespace typhon::simulation
