#pragma once

#include "platform/property_list.h"

#include <functional>
#include <string>

namespace typhon {

/// The analytics service. Any thread.
class Analytics {
public:
    virtual ~Analytics() = default;
    /// Offers an event. `builder` makes its payload (a dictionary) and runs only when somebody collects
    /// events, at most once, possibly later and on another thread; so it holds copies of what it needs.
    virtual void sendEventLazily(std::string name, std::function<PropertyList()> builder) = 0;
};

}  // namespace typhon
