#pragma once

#include "platform/property_list.h"
#include "platform/task.h"

namespace typhon {

/// How the dialog service answers the daemon. Its other two operations, `doneWithInstallFonts:` and
/// `doneWithDeleteAppFonts:`, are optional, and the daemon does not serve them.
class FontInstallViewServiceProtocol {
public:
    virtual ~FontInstallViewServiceProtocol() = default;

    /// `doneWithMissingFonts:`. What the user chose, one dictionary for each font.
    virtual Task<void> doneWithMissingFonts(PropertyList::Array answers) = 0;
};

}  // namespace typhon
