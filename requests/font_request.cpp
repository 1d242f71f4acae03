#include "requests/font_request.h"

#include "platform/file_url.h"
#include "requests/dialog_answers.h"
#include "requests/request_analytics.h"

#include <exception>

// The client is answered first and the books are kept afterwards: switching fonts on, the ledger and the end
// of the request's turn make nobody wait who asked. Whatever fails on the way, the turn ends: an error must
// not close the gate for everybody. Only a dialog that nobody answers may.

namespace typhon {

namespace {

std::vector<std::string> pathsIn(const PropertyList& fonts)
{
    std::vector<std::string> paths;
    for (const auto& [path, entry] : *fonts.asDictionary()) {
        paths.push_back(path);
    }
    return paths;
}

/// Both dictionaries in one; where both have an entry, that of `added`.
PropertyList merged(const PropertyList& base, const PropertyList& added)
{
    if (added.asDictionary()->empty()) {
        return base;
    }
    auto all = *added.asDictionary();
    all.insert(base.asDictionary()->begin(), base.asDictionary()->end());
    return all;
}

}  // namespace

FontRequest::FontRequest(const FontRequestServices& services, FontRequester requester, DictionaryReply reply)
    : services_(services), requester_(std::move(requester)), reply_(std::move(reply))
{}

Task<void> FontRequest::resolve(std::shared_ptr<FontRequest> request, PropertyList::Array requests)
{
    auto& services = request->services_;
    auto names = services.resolution.unknownFontNamesAndEnabledFamilyNames(requests);
    request->fontInfo_ = request->enabledFonts(names.enabledFamilyNames);
    analyticsEventRequestFonts(services.platform.analytics, request->requester_.signingIdentifier,
                               names.unknownFontNames.size(), names.disabledFamilyNames.size(),
                               names.enabledFamilyNames.size());
    const bool missed = !names.unknownFontNames.empty() || !names.disabledFamilyNames.empty();
    const bool resolved = !names.enabledFamilyNames.empty();
    auto finishing = missed ? request->askUser(request, std::move(names)) : finish(request, {});
    co_await std::move(finishing);
    services.counters.recordRequestFontsResultWihtMissed(missed, resolved);
}

Task<void> FontRequest::askUser(std::shared_ptr<FontRequest> self, PlacedFontNames names)
{
    auto& dialog = services_.dialog;
    auto records = MissingFontsDialog::missingFontsDialogRequestsFromUnknownFontNames(names.unknownFontNames);
    auto disabled = dialog.missingFontsDialogRequestsFromDisabledFamilyNames(names.disabledFamilyNames);
    records.insert(records.end(), disabled.begin(), disabled.end());
    // The identifier of this very process instance, so that nobody who inherited its number gets a dialog.
    const auto process = LWSProcessIdentifier::identifierWithPid(requester_.token);
    MissingFontsDialog::CompletionHandler answered = [self](PropertyList::Array answers) {
        return finish(self, std::move(answers));
    };
    auto showing = dialog.showDialog(std::move(records), process, std::move(answered));
    co_await std::move(showing);
}

Task<void> FontRequest::finish(std::shared_ptr<FontRequest> request, PropertyList::Array answers)
{
    std::exception_ptr failure;
    try {
        auto handingOut = request->handOut(std::move(answers));
        co_await std::move(handingOut);
    } catch (...) {
        failure = std::current_exception();
    }
    auto completing = complete(request);
    co_await std::move(completing);
    if (failure) {
        std::rethrow_exception(failure);
    }
}

Task<void> FontRequest::handOut(PropertyList::Array answers)
{
    auto chosen = chosenFonts(answers);
    const auto fonts = merged(fontInfo_, chosen.fontInfo);
    answer(fonts);
    if (!chosen.urls.empty()) {
        auto switching = switchOn(std::move(chosen.urls));
        co_await std::move(switching);
    }
    record(fonts);
}

PropertyList FontRequest::enabledFonts(const std::vector<std::string>& familyNames)
{
    const auto registry = services_.registry.userFontsInfo();
    if (!registry) {
        return {};
    }
    return services_.perClientFontInfo.filterUserFontInfoForAuditToken(
        requester_.token, requester_.hasEnumeration,
        [](const std::string&, const PropertyList& entry, bool&) { return !isDisabled(entry); },
        registry->entriesWithAnyFamilyName(familyNames));
}

FontRequest::Chosen FontRequest::chosenFonts(const PropertyList::Array& answers)
{
    const DialogAnswers choice(answers);
    const auto families = choice.families();
    const auto registry = services_.registry.userFontsInfo();
    if (families.empty() || !registry) {
        return {};
    }
    Chosen chosen;
    chosen.fontInfo = services_.perClientFontInfo.filterUserFontInfoForAuditToken(
        requester_.token, requester_.hasEnumeration,
        [&](const std::string& path, const PropertyList& entry, bool&) {
            const auto provider =
                isDisabled(entry) ? services_.resolution.identifierFromFilePath(path) : std::nullopt;
            const bool isChosen = provider && choice.choose(*provider, entry);
            if (isChosen) {
                chosen.urls.push_back(fileUrlFromPath(path));
            }
            return isChosen;
        },
        registry->entriesWithAnyFamilyName(families));
    return chosen;
}

Task<void> FontRequest::switchOn(std::vector<std::string> urls)
{
    AwaitCompletion<FontManagerError>::Start begin = [&](auto done) {
        services_.platform.userFontManager.enableOrDisablePersistentURLs(std::move(urls), true,
                                                                         std::move(done));
    };
    auto completion = awaitCompletion<FontManagerError>(std::move(begin));
    const auto error = co_await completion;
    if (error) {
        TYLog_Error(services_.platform.log, "enableOrDisablePersistentURLs:enabled: failed: " + *error);
    }
    services_.registry.invalidateUserFonts();
}

void FontRequest::answer(const PropertyList& fonts)
{
    if (!isAnswered_.exchange(true)) {
        reply_(fonts);
    }
}

void FontRequest::record(const PropertyList& fonts)
{
    services_.ledger.recordIssuedFontPaths(pathsIn(fonts), requester_.signingIdentifier);
}

Task<void> FontRequest::complete(std::shared_ptr<FontRequest> request)
{
    if (request->isComplete_.exchange(true)) {
        co_return;
    }
    auto leaving = request->services_.gate.leave();
    co_await std::move(leaving);
}

}  // namespace typhon
