#pragma once

#include "platform/linux/root_directory.h"

#include <optional>
#include <string>

namespace typhon {

/// What became of a change to the kept providers.
struct KeptProviderOutcome {
    /// The desktop entry that stands for the provider.
    std::string path;
    /// Null when it was done.
    std::optional<std::string> error;
};

/// Makes a provider count as installed that has no desktop entry of its own, by writing one into the
/// administrator's local data directory. Another program's entry there is never replaced.
KeptProviderOutcome keepProvider(const RootDirectory& root, const std::string& identifier);

/// Takes such an entry away again; one that `keepProvider` did not write is an error.
KeptProviderOutcome dropKeptProvider(const RootDirectory& root, const std::string& identifier);

}  // namespace typhon
