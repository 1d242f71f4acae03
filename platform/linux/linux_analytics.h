#pragma once

#include "platform/analytics.h"

namespace typhon {

/// Analytics on Linux. Nobody collects, so nothing is built. Any thread.
class LinuxAnalytics final : public Analytics {
public:
    void sendEventLazily(std::string /*name*/, std::function<PropertyList()> /*builder*/) override {}
};

}  // namespace typhon
