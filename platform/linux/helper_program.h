#pragma once

#include <optional>

namespace typhon {

/// For the `main` of a program that only programs of ours start, with a socket for packets as its standard
/// input: shows `usage` to anybody else, on standard output when asked with "--help". What to exit with then;
/// null when the program was started as it should be.
std::optional<int> exitUnlessStartedByUs(int count, char** arguments, const char* usage);

}  // namespace typhon
