#pragma once

#include "child.h"

#include <cstddef>
#include <string>
#include <vector>

namespace typhon::bench {

/// Many connections that do nothing after one first call, held by processes of 200 each.
class IdleClients {
public:
    /// Returns when all have had the answer to `member` of `interface` (a call without arguments).
    IdleClients(const std::string& socketPath, std::size_t count, const char* interface, const char* member);

private:
    std::vector<Child> holders_;
};

}  // namespace typhon::bench
