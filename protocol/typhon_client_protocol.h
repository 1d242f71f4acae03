#pragma once

#include "platform/task.h"
#include "protocol/replies.h"

namespace typhon {

/// What the daemon tells its clients.
class TyphonClientProtocol {
public:
    virtual ~TyphonClientProtocol() = default;

    /// `fontAddedInfo:addedURLStrings:removedURLStrings:`. Fonts that came, with what is needed to use them,
    /// or fonts that went.
    virtual Task<void> fontAddedInfo(std::optional<PropertyList> info, OptionalStrings addedURLStrings,
                                     OptionalStrings removedURLStrings) = 0;
};

}  // namespace typhon
