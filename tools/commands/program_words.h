#pragma once

#include <string>
#include <vector>

namespace typhon {

/// A command line cut in two: what typhonctl reads, and the program that "run" starts with its arguments,
/// which may look like anything.
struct SplitCommandLine {
    std::vector<std::string> own;
    std::vector<std::string> program;
};

/// Cuts behind "run" at the first word that is not one of its options, and drops a "--" there. A command
/// line of another command, or with an unknown option, stays whole.
SplitCommandLine splitCommandLine(const std::vector<std::string>& words);

}  // namespace typhon
