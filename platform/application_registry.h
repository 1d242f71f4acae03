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

/// The registry of installed applications. Any thread; an answer is given only after a complete scan.
class ApplicationRegistry {
public:
    virtual ~ApplicationRegistry() = default;
    /// The record of that application, or null when it is not installed, or only as a placeholder and
    /// `allowPlaceholder` is false.
    virtual std::optional<SWApplicationRecord> record(const std::string& bundleIdentifier,
                                                      bool allowPlaceholder) = 0;
};

}  // namespace typhon
