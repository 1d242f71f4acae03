#pragma once

#include <optional>
#include <string>

namespace typhon {

/// What the device knows of one installed application.
struct SWApplicationRecord {
    std::string bundleIdentifier;
    std::optional<std::string> shortVersionString;
    /// Announced but not (yet) really installed.
    bool isPlaceholder = false;
};

/// The registry of installed applications. Any thread.
class ApplicationRegistry {
public:
    virtual ~ApplicationRegistry() = default;
    /// The record of that application, or null when it is not installed, or only as a placeholder and
    /// `allowPlaceholder` is false.
    virtual std::optional<SWApplicationRecord> record(const std::string& bundleIdentifier,
                                                      bool allowPlaceholder) = 0;
    /// True when that application is certainly not installed: everything that could describe it was looked
    /// at, and nothing does, or only as a placeholder. False also when that cannot be told just now, so that
    /// `record` may be null and this false.
    virtual bool isKnownToBeAbsent(const std::string& bundleIdentifier) = 0;
};

}  // namespace typhon
