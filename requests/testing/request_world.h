#pragma once

#include "platform/simulated/simulated_platform.h"
#include "protocol/wire.h"
#include "requests/font_name_resolution.h"
#include "requests/font_picker_requests.h"
#include "requests/font_requests.h"
#include "requests/missing_fonts_dialog.h"

#include <chrono>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace typhon::testing_aid {

using Array = PropertyList::Array;
using Dictionary = PropertyList::Dictionary;

inline const std::string fontFiles = "/var/mobile/Library/UserFonts/FontFiles/";

/// A font request for names of either kind.
inline PropertyList family(const std::string& name)
{
    return Dictionary{{kLFFontFamilyNameAttribute, name}};
}
inline PropertyList postScript(const std::string& name)
{
    return Dictionary{{kLFFontNameAttribute, name}};
}
inline PropertyList familyAndPostScript(const std::string& familyName, const std::string& name)
{
    return Dictionary{{kLFFontFamilyNameAttribute, familyName}, {kLFFontNameAttribute, name}};
}
/// A user's choice.
inline PropertyList choice(const std::string& familyName, const std::string& provider)
{
    return Dictionary{{"uniqueID", familyName}, {"installProvider", provider}};
}

/// Everything that requests stand on, over one simulated device.
class RequestWorld {
public:
    using Faces = std::map<std::string, std::string>;

    /// Installs a font file with those faces (PostScript name to family) by writing the registry anew.
    void install(const std::string& path, const Faces& faces, bool isDisabled = false)
    {
        Dictionary names(faces.begin(), faces.end());
        fonts_.insert_or_assign(path, Dictionary{{"familyName", std::move(names)}, {"disabled", isDisabled}});
        simulated.fileSystem.addFile(UserFontRegistry::path, fonts_);
        registry.invalidateUserFonts();
    }
    bool isSwitchedOn(const std::string& path)
    {
        const auto file = simulated.fileSystem.readPropertyList(UserFontRegistry::path);
        return !isDisabled(*file.value->find(path));
    }

    AuditToken add(const std::string& identifier, std::optional<PropertyList> userFonts,
                   bool isVisible = true)
    {
        Dictionary entitlements;
        if (userFonts) {
            entitlements.emplace("com.vorlan.developer.user-fonts", *std::move(userFonts));
        }
        const auto token = simulated.processes.add(
            {.signingIdentifier = identifier, .entitlements = std::move(entitlements)});
        simulated.processLifecycle.setVisible(token, isVisible);
        return token;
    }
    AuditToken addApplication(const std::string& identifier, bool isVisible = true)
    {
        return add(identifier, Array{"app-usage"}, isVisible);
    }

    void advance(std::chrono::nanoseconds time) { simulated.scheduler.advance(time); }
    std::int64_t missed() { return simulated.preferences.integer("missed"); }
    std::int64_t resolved() { return simulated.preferences.integer("resolved"); }

    SimulatedPlatform simulated;
    /// Stands for the daemon that all of this belongs to.
    std::shared_ptr<int> daemon = std::make_shared<int>();
    std::shared_ptr<WorkQueue> mainHandlerQueue = simulated.queues.createSerialQueue("com.vorlan.typhond");
    UserFontUpdates updates{simulated.platform.processWideQueues};
    UserFontRegistry registry{simulated.fileSystem, simulated.log, updates};
    IssuedPathsLedger ledger{simulated.preferences, simulated.codeSigning, registry};
    PerClientFontInfo fontInfo{
        simulated.platform,
        registry,
        *mainHandlerQueue,
        {[this](const AuditToken& token) { return simulated.sandbox.isSandboxed(token); },
         [this](const std::string& identifier) {
             return ledger.issuedFontFilePathsForIdentifier(identifier);
         }}};
    FontNameResolution resolution{registry, simulated.userFontManager};
    MissingFontsDialog dialog{simulated.platform, resolution, [this] { return daemon; }};
    FontRequests fontRequests{
        {simulated.platform, *mainHandlerQueue, registry, fontInfo, resolution, ledger, dialog}};
    FontPickerRequests fontPickerRequests{{simulated.platform, registry, fontInfo, resolution, ledger}};

private:
    Dictionary fonts_;
};

/// One connection of an application, as the daemon sees it.
class RequestingClient {
public:
    RequestingClient(RequestWorld& world, const AuditToken& token)
        : world_(world), pair_(world.simulated.connect(token)),
          queue_(world.simulated.queues.createSerialQueue("connection of a test"))
    {}

    /// Calls `requestFonts:reply:` and lets happen what happens at once.
    void request(Array requests)
    {
        start(requests);
        world_.simulated.drain();
    }
    void start(Array requests)
    {
        DictionaryReply reply = [replies = replies_](PropertyList fonts) {
            replies->push_back(std::move(fonts));
        };
        queue_->asyncForConnection(pair_.accepted,
                                   world_.fontRequests.requestFonts(std::move(requests), std::move(reply)));
    }
    /// Something else that the client asks for over the same connection; true once it was its turn.
    std::shared_ptr<bool> callSomethingElse()
    {
        auto isHandled = std::make_shared<bool>(false);
        queue_->async([isHandled] { *isHandled = true; });
        world_.simulated.drain();
        return isHandled;
    }
    const std::vector<PropertyList>& replies() const { return *replies_; }
    /// The paths of the only reply.
    std::vector<std::string> paths() const
    {
        std::vector<std::string> paths;
        for (const auto& [path, entry] : *replies_->at(0).asDictionary()) {
            paths.push_back(path);
        }
        return replies_->size() == 1 ? paths : std::vector<std::string>{"not one reply"};
    }

private:
    RequestWorld& world_;
    SimulatedConnectionPair pair_;
    std::shared_ptr<WorkQueue> queue_;
    std::shared_ptr<std::vector<PropertyList>> replies_ = std::make_shared<std::vector<PropertyList>>();
};

/// The service that shows the dialogs, connected to one of them.
class ViewService {
public:
    ViewService(RequestWorld& world, std::size_t alert)
        : world_(world), connection_(world.simulated.remoteAlerts.connectViewService(
                             alert, processOfDaemonsUser(), wire::fontInstallViewServiceInterfaces()))
    {
        world.simulated.drain();
    }

    void answer(Array answers)
    {
        Arguments arguments;
        arguments.emplace_back(PropertyList(std::move(answers)));
        connection_->call(
            wire::doneWithMissingFonts.interface, wire::doneWithMissingFonts.member, std::move(arguments),
            [outcomes = outcomes_](Arguments) { return note(outcomes, "answered"); },
            [outcomes = outcomes_](const IpcError& error) { outcomes->push_back(error.name); });
        world_.simulated.drain();
    }
    const std::vector<std::string>& outcomes() const { return *outcomes_; }
    void disconnect()
    {
        connection_->invalidate();
        world_.simulated.drain();
    }

private:
    using Outcomes = std::shared_ptr<std::vector<std::string>>;

    static AuditToken processOfDaemonsUser()
    {
        return {
            .version = 1, .processIdentifier = 9, .processInstance = 9, .execGeneration = 1, .bootEpoch = 1};
    }
    static Task<void> note(Outcomes outcomes, std::string outcome)
    {
        outcomes->push_back(std::move(outcome));
        co_return;
    }

    RequestWorld& world_;
    std::shared_ptr<Connection> connection_;
    Outcomes outcomes_ = std::make_shared<std::vector<std::string>>();
};

}  // namespace typhon::testing_aid
