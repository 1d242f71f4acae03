#pragma once

#include <cstdint>
#include <vector>

namespace typhon::simulation {

/// The seeds to run: one given with `--seed N`, else the first of as many as `--seeds N` or the environment
/// variable TYPHON_SEEDS say, else of as many as the build was
/// configured for.
const std::vector<std::uint64_t>& seeds();

/// Takes the options out of the command line. Ends the process with a message on one it cannot read.
void readSeedOptions(int& argumentCount, char** arguments);

}  // namespace typhon::simulation
