#pragma once

#include "platform/task.h"
#include "protocol/replies.h"

#include <string>

namespace typhon {

/// What the daemon asks of an application for which the font picker works, at that application's endpoint.
class TyphonFontPickerClientSupportProtocol {
public:
    virtual ~TyphonFontPickerClientSupportProtocol() = default;

    /// `ping:reply:`. Any answer will do: it makes the application known to the daemon.
    virtual Task<void> ping(std::string text, StringReply reply) = 0;
    /// `activateFontsForFontPickerClient:reply:`. Fonts to use, by path; the answer says whether they are.
    virtual Task<void> activateFontsForFontPickerClient(PropertyList fonts, BooleanReply reply) = 0;
};

}  // namespace typhon
