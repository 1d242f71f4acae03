#include "requests/missing_fonts_dialog.h"

#include <map>

namespace typhon {

namespace {

using Array = PropertyList::Array;
using Dictionary = PropertyList::Dictionary;

}  // namespace

Array MissingFontsDialog::missingFontsDialogRequestsFromUnknownFontNames(
    const std::vector<std::string>& names)
{
    Array rows;
    rows.reserve(names.size());
    for (const auto& name : names) {
        rows.emplace_back(Dictionary{{"displayName", name}, {"providers", Array{}}});
    }
    return rows;
}

Array MissingFontsDialog::missingFontsDialogRequestsFromDisabledFamilyNames(
    const std::vector<std::string>& familyNames)
{
    std::map<std::string, std::set<std::string>> providersByFamily;
    for (const auto& family : familyNames) {
        providersByFamily[family].merge(resolution_.providerIdentifiersFromFamilyName(family));
    }
    Array rows;
    rows.reserve(providersByFamily.size());
    for (const auto& [family, providers] : providersByFamily) {
        rows.emplace_back(Dictionary{{"displayName", family},
                                     {"providers", Array(providers.begin(), providers.end())},
                                     {"uniqueID", family}});
    }
    return rows;
}

Task<void> MissingFontsDialog::showDialog(Array records, LWSProcessIdentifier forPID,
                                          CompletionHandler completionHandler)
{
    const bool isSeen = isVisible(forPID);
    if (isSeen && platform_.remoteAlerts.isDefinitionClassAvailable()) {
        missingFontsDialogHandler_ = std::make_shared<MissingFontsDialogHandler>(
            platform_, typhonDaemon_(), std::move(completionHandler));
        missingFontsDialogHandler_->showDialogWithUserInfo(Dictionary{{"fonts", std::move(records)}});
        co_return;
    }
    if (!isSeen) {
        TYLog(platform_.log, "An application (pid:" + std::to_string(forPID.process.processIdentifier) +
                                 ") tried to show missing fonts dialog in the background.  It's ignored.");
    }
    auto answering = completionHandler({});
    co_await std::move(answering);
}

bool MissingFontsDialog::isVisible(const LWSProcessIdentifier& process)
{
    const auto state = platform_.processLifecycle.currentState(process);
    return state && state->endowmentNamespaces.contains(visibilityEndowmentNamespace);
}

}  // namespace typhon
