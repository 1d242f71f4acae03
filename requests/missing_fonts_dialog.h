#pragma once

#include "platform/platform.h"
#include "requests/font_name_resolution.h"
#include "requests/missing_fonts_dialog_handler.h"

#include <functional>
#include <memory>
#include <string>
#include <vector>

namespace typhon {

/// Asks the user about fonts that an application lacks: makes the rows of the dialog and has it shown, over
/// applications that the user can see and no others. On `mainHandlerQueue`.
class MissingFontsDialog {
public:
    using CompletionHandler = MissingFontsDialogHandler::CompletionHandler;

    /// Everything given outlives this. `typhonDaemon` gives the daemon, which is asked for at each dialog.
    MissingFontsDialog(Platform& platform, FontNameResolution& resolution,
                       std::function<std::weak_ptr<void>()> typhonDaemon)
        : platform_(platform), resolution_(resolution), typhonDaemon_(std::move(typhonDaemon))
    {}

    /// `missingFontsDialogRequestsFromUnknownFontNames:`. A row for each name, in that order.
    static PropertyList::Array
    missingFontsDialogRequestsFromUnknownFontNames(const std::vector<std::string>& names);

    /// `missingFontsDialogRequestsFromDisabledFamilyNames:`. A row for each family, sorted by name, with the
    /// applications whose files carry it; a family that is given twice has one row.
    PropertyList::Array
    missingFontsDialogRequestsFromDisabledFamilyNames(const std::vector<std::string>& familyNames);

    /// `showDialog:forPID:completionHandler:`. Shows the rows over that process and returns; the handler runs
    /// when the answer comes, which may be never. A process that the user cannot see, or no service that
    /// could show a dialog, is an empty answer at once: then the task ends with the handler's.
    Task<void> showDialog(PropertyList::Array records, LWSProcessIdentifier forPID,
                          CompletionHandler completionHandler);

    /// The handler of the latest dialog, answered or not; null before the first.
    std::shared_ptr<MissingFontsDialogHandler> missingFontsDialogHandler() const
    {
        return missingFontsDialogHandler_;
    }

private:
    bool isVisible(const LWSProcessIdentifier& process);

    Platform& platform_;
    FontNameResolution& resolution_;
    const std::function<std::weak_ptr<void>()> typhonDaemon_;
    std::shared_ptr<MissingFontsDialogHandler> missingFontsDialogHandler_;
};

}  // namespace typhon
