#pragma once

#include "child.h"
#include "platform/linux/file_descriptor.h"

#include <cstddef>
#include <string>
#include <vector>

namespace typhon::bench {

/// Many connections that each wait for messages, held by processes of 200 each.
class Receivers {
public:
    /// Returns when all have had the answer to `member` of `interface` (a call without arguments).
    Receivers(const std::string& socketPath, std::size_t count, const char* interface, const char* member);

    /// Returns when each has received one more message. Throws when one of them ended.
    void awaitOneEach() const;

private:
    struct Holder {
        Child process;
        FileDescriptor signs;
    };
    std::vector<Holder> holders_;
};

}  // namespace typhon::bench
