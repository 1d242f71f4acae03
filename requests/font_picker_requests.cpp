#include "requests/font_picker_requests.h"

#include "platform/ipc.h"
#include "protocol/wire.h"

#include <chrono>

namespace typhon {

namespace {

constexpr std::chrono::nanoseconds longestWait = std::chrono::seconds(25);
constexpr const char* operationName = "requestFonts:forClient:reply:";

std::shared_ptr<Connection> connectTo(Platform& platform, std::shared_ptr<ListenerEndpoint> client)
{
    auto connection = platform.ipc.connectionToEndpoint(std::move(client));
    connection->setInvalidationHandler(
        [&log = platform.log] { systemLog(log, "requestFonts:forClient: connection invalidated."); });
    connection->setRemoteObjectInterfaces(wire::typhonFontPickerClientSupportInterfaces());
    connection->resume();
    return connection;
}

/// Calls the client and waits; null when it gave no answer, which is logged.
Task<std::optional<Arguments>> callClient(Log& log, std::shared_ptr<Connection> client,
                                          wire::Operation operation, PropertyList argument)
{
    Arguments arguments;
    arguments.emplace_back(std::move(argument));
    auto calling =
        client->callAndWait(operation.interface, operation.member, std::move(arguments), longestWait.count());
    auto outcome = co_await std::move(calling);
    if (!outcome.results) {
        systemLog(log, std::string("sluice error: ") + operationName + " - " + outcome.error.name + ": " +
                           outcome.error.message);
    }
    co_return std::move(outcome.results);
}

}  // namespace

Task<void> FontPickerRequests::requestFonts(std::string postScriptName,
                                            std::shared_ptr<ListenerEndpoint> forClient, BooleanReply reply)
{
    const auto client = connectTo(services_.platform, std::move(forClient));
    auto providers = services_.resolution.providerIdentifiersAndFamilyName(postScriptName);
    bool isAnswered = false;
    if (providers.familyName) {
        auto offering = offerFamily(client, *std::move(providers.familyName), reply);
        isAnswered = co_await std::move(offering);
    }
    if (!isAnswered) {
        reply(false);
    }
    client->invalidate();
}

Task<bool> FontPickerRequests::offerFamily(std::shared_ptr<Connection> client, std::string familyName,
                                           BooleanReply reply)
{
    auto& log = services_.platform.log;
    // The answer to the first call makes sure who is at the other end.
    auto pinging = callClient(log, client, wire::pingFontPickerClient, "");
    const auto pong = co_await std::move(pinging);
    const auto fonts = pong ? fontsOfFamily(client->auditToken(), familyName) : PropertyList();
    if (fonts.asDictionary()->empty()) {
        co_return false;
    }
    auto activating = callClient(log, client, wire::activateFontsForFontPickerClient, fonts);
    const auto activated = co_await std::move(activating);
    if (activated) {
        reply(std::get<PropertyList>(activated->at(0)).isTrue());
    }
    // It has been sent them, whatever it said.
    record(client->auditToken(), fonts);
    co_return activated.has_value();
}

PropertyList FontPickerRequests::fontsOfFamily(const AuditToken& client, const std::string& familyName)
{
    const auto registry = services_.registry.userFontsInfo();
    if (!registry) {
        return {};
    }
    // Intended: fonts that are switched off are offered too, since the user has chosen them.
    return services_.perClientFontInfo.filterUserFontInfoForAuditToken(
        client, false, [](const std::string&, const PropertyList&, bool&) { return true; },
        registry->entriesWithFamilyName(familyName));
}

void FontPickerRequests::record(const AuditToken& client, const PropertyList& fonts)
{
    const auto task = services_.platform.codeSigning.taskFromAuditToken(client);
    if (!task || !task->signingIdentifier) {
        return;
    }
    std::vector<std::string> paths;
    for (const auto& [path, entry] : *fonts.asDictionary()) {
        paths.push_back(path);
    }
    services_.ledger.recordIssuedFontPaths(std::move(paths), task->signingIdentifier);
}

}  // namespace typhon
