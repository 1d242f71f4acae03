#pragma once

#include <cstdio>
#include <cstdlib>

namespace typhon {

/// Ends a fuzzer's run with a finding unless `condition` holds.
inline void require(bool condition, const char* what)
{
    if (condition)
        return;
    std::fprintf(stderr, "violated: %s\n", what);
    std::abort();
}

}  // namespace typhon
