#include "lifecycle/application_removal.h"

#include <functional>
#include <utility>

// Removed applications are dealt with one after another, and while one of them is, nothing else runs on the
// main queue: the next announcement waits. No thread waits, though, least of all the main one. An announced
// removal is believed as it stands; only the sweep asks the registry of applications.

namespace typhon {

namespace {

constexpr const char* applicationUnregistered = "com.vorlan.Startwell.applicationUnregistered";
constexpr const char* bundleIDs = "bundleIDs";

bool isNamed(const PropertyList& event, std::string_view name)
{
    const auto* found = event.find(event_streams::eventName);
    const auto* text = found == nullptr ? nullptr : found->asString();
    return text != nullptr && *text == name;
}

/// Its type is nobody's promise: what is no array is as good as an empty one.
std::vector<std::string> identifiersIn(const PropertyList& userInfo)
{
    const auto* identifiers = userInfo.find(bundleIDs);
    return identifiers == nullptr || identifiers->asArray() == nullptr ? std::vector<std::string>{}
                                                                       : stringsOf(*identifiers);
}

/// The main queue lives as long as the platform.
std::shared_ptr<WorkQueue> unowned(WorkQueue& queue)
{
    return {std::shared_ptr<void>(), &queue};
}

}  // namespace

void ApplicationRemoval::setupForDistributedNotifications()
{
    platform_.notifications.setEventStreamHandler(event_streams::distributed,
                                                  unowned(platform_.queues.mainQueue()),
                                                  [weak = weak_from_this()](const PropertyList& event) {
                                                      if (const auto self = weak.lock()) {
                                                          self->handleEvent(event);
                                                      }
                                                  });
}

void ApplicationRemoval::handleEvent(const PropertyList& event)
{
    const auto* userInfo = event.find(event_streams::userInfo);
    if (!isNamed(event, applicationUnregistered) || userInfo == nullptr ||
        userInfo->asDictionary() == nullptr) {
        return;
    }
    platform_.queues.mainQueue().async(forgetApplications(shared_from_this(), identifiersIn(*userInfo)));
}

Task<void> ApplicationRemoval::forgetApplications(std::shared_ptr<ApplicationRemoval> self,
                                                  std::vector<std::string> identifiers)
{
    for (const auto& identifier : identifiers) {
        Task<void> unregistering = self->unregister(identifier);
        co_await std::move(unregistering);
        self->postForgettingOf(identifier);
    }
    self->synchronizeFontProviders();
}

/// Ends when the completion has run.
Task<void> ApplicationRemoval::unregister(std::string identifier)
{
    std::function<void(std::function<void()>)> begin = [this, identifier](std::function<void()> done) {
        const auto completion = [&log = platform_.log, identifier, done](const FontManagerError& error) {
            if (error) {
                TYLog_Debug(log, "unregistering " + identifier + " error - " + *error);
            }
            done();
        };
        platform_.userFontManager.unregisterAndRemoveFontFilesForIdentifier(identifier, completion);
    };
    co_await awaitCompletion<void>(std::move(begin));
}

void ApplicationRemoval::postForgettingOf(const std::string& identifier)
{
    mainHandlerQueue_.async([weak = weak_from_this(), identifier] {
        if (const auto self = weak.lock()) {
            self->ledger_.forgetClientApplication(identifier);
        }
    });
}

void ApplicationRemoval::synchronizeFontProviders()
{
    TYLog(platform_.log, "synchroning FontProviders");
    platform_.userFontManager.synchronizeFontProviders();
}

void ApplicationRemoval::sweepStrayEntries()
{
    sweepStrayProviders();
    sweepStrayClients();
}

void ApplicationRemoval::sweepStrayProviders()
{
    for (const auto& identifier : platform_.userFontManager.knownFontProviders()) {
        if (!isStray(identifier)) {
            continue;
        }
        TYLog_Debug(platform_.log, "stray provider \"" + identifier + "\" detected");
        const auto completion = [&log = platform_.log, identifier](const FontManagerError& error) {
            if (error) {
                TYLog_Error(log, "unregistering stray provider \"" + identifier + "\" error - " + *error);
            }
        };
        platform_.userFontManager.unregisterAndRemoveFontFilesForIdentifier(identifier, completion);
    }
}

void ApplicationRemoval::sweepStrayClients()
{
    for (const auto& [identifier, paths] : platform_.preferences.dictionary("issues")) {
        if (isStray(identifier)) {
            TYLog_Debug(platform_.log, "stray client \"" + identifier + "\" detected");
            postForgettingOf(identifier);
        }
    }
}

bool ApplicationRemoval::isStray(const std::string& identifier)
{
    // Intended: a placeholder is no application. Who may be installed keeps everything until the next start.
    return platform_.applicationRegistry.isKnownToBeAbsent(identifier);
}

}  // namespace typhon
