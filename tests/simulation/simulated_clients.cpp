#include "simulation/simulated_clients.h"

#include "platform/font_directories.h"

#include <algorithm>
#include <array>

namespace typhon::simulation {

namespace {

PropertyList::Dictionary userFonts(const std::vector<std::string>& strings)
{
    return {{"com.vorlan.developer.user-fonts", arrayOfStrings(strings)}};
}

/// The daemon's interfaces, with one member too many and one of other types.
InterfaceDescriptions hostileInterfaces()
{
    auto interfaces = *wire::typhonDaemonInterfaces();
    for (auto& member : interfaces[0].members) {
        if (member.name == wire::resetIssuedFontsFor.member) {
            member.inTypes = "x";
        }
    }
    interfaces[0].members.push_back({"checkout", "", "", true});
    return std::make_shared<const std::vector<InterfaceDescription>>(std::move(interfaces));
}

bool needsNoGrant(const std::string& path)
{
    return path.starts_with(font_directories::assetStore);
}

}  // namespace

const std::vector<ClientKind>& clientKinds()
{
    static const std::vector<ClientKind> kinds{
        {"editor", "com.example.editor", userFonts({"font-enumeration"}), true},
        {"barred", "com.example.barred", userFonts({"font-enumeration"})},
        {"reader", "com.example.reader", userFonts({"app-usage"}), false, true},
        {"provider", "com.example.provider", userFonts({"system-installation"}), false, false, true},
        {"suite", "com.example.suite", userFonts({"system-installation", "app-usage"}), false, true, true},
        {"all", "com.example.all", userFonts({"font-enumeration", "app-usage", "system-installation"}), true,
         true, true},
        {"plain", "com.example.plain", {}},
        {"string", "com.example.string", {{"com.vorlan.developer.user-fonts", "font-enumeration"}}},
        {"unsigned", std::nullopt, {}},
        {"helper", "com.vorlan.Typhon.UserFontManager",
         userFonts({"font-enumeration", "app-usage", "system-installation"})},
        {"picker", "com.vorlan.Panekit.FontPicker", {}, false, false, false, true},
        {"tool", "com.example.tool", {{"com.vorlan.Typhon.allow-reset-issued-fonts", true}}},
    };
    return kinds;
}

SimulatedClient::SimulatedClient(World& world, const ClientKind& kind) : world_(world), kind_(kind)
{
    process_.signingIdentifier = kind.identifier;
    process_.entitlements = kind.entitlements;
    process_.isSandboxed = pick(4) != 0;
    process_.acceptsExtensions = pick(6) != 0;
    for (auto count = pick(4); count != 0; --count) {
        process_.readablePaths.insert(world.registry.somePath());
    }
    token_ = world.simulated.processes.add(process_);
    isHostile_ = pick(5) == 0;
    name_ = kind.name + " " + std::to_string(token_.processIdentifier);
}

void SimulatedClient::connect()
{
    connection_ = world_.simulated.ipc.connectClient(wire::serviceName, token_);
    connection_->setRemoteObjectInterfaces(isHostile_ ? hostileInterfaces() : wire::typhonDaemonInterfaces());
    connection_->setExportedInterfaces(wire::typhonClientInterfaces());
    connection_->setExportedObject(
        std::make_shared<ChangeListener>([this](const HeardChange& change) { hear(change); }));
    connection_->resume();
}

void SimulatedClient::act()
{
    const auto what = pick(30);
    if (what == 0) {
        disconnect();
    } else if (what == 1) {
        becomeNobody();
    } else if (what == 2) {
        vanish();
    } else if (!isGone_ || connection_) {
        callSomething();
    }
}

void SimulatedClient::callSomething()
{
    const Arguments list{PropertyList(PropertyList::Array{})};
    const auto endpoint = world_.simulated.ipc.process(token_)->anonymousListener()->endpoint();
    if (!connection_) {
        connect();
    }
    switch (pick(isHostile_ ? 12 : 10)) {
    case 0:
        call(wire::checkinForFontPicker, {}, &SimulatedClient::judgePickerCheckIn);
        break;
    case 1:
        call(wire::updatingUserFonts);
        break;
    case 2:
        call(wire::sendFonts, list)->isNeverAnswered = true;
        break;
    case 3:
        call(wire::requestFonts, list);
        break;
    case 4:
        call(wire::fontChanged, {someReport(world_)});
        break;
    case 5:
        call(wire::scheduleFontFilesDeletion, {arrayOfStrings({world_.registry.somePath(), "/etc/passwd"})});
        break;
    case 6:
        checkInContent();
        break;
    case 7:
        call(wire::requestFontsForClient, {PropertyList("Alpha-Regular"), endpoint}, nullptr,
             kind_.isFontPicker ? std::nullopt : std::optional<std::string>(ipc_errors::accessDenied));
        break;
    case 8:
        if (isHostile_) {
            call(wire::resetIssuedFontsFor, {PropertyList(1)}, nullptr, ipc_errors::invalidArguments);
        } else {
            call(wire::resetIssuedFontsFor, {PropertyList("com.example.reader")});
        }
        break;
    case 10: {
        auto unknown = wire::checkin;
        unknown.member = "checkout";
        call(unknown, {}, nullptr, ipc_errors::unknownMethod);
        break;
    }
    default:
        call(wire::checkin, {}, &SimulatedClient::judgeCheckIn);
    }
}

std::shared_ptr<SimulatedClient::Call> SimulatedClient::call(const wire::Operation& operation,
                                                             Arguments arguments, Judge judge,
                                                             std::optional<std::string> expectedError)
{
    auto made = std::make_shared<Call>(Call{operation.member, connection_});
    calls_.push_back(made);
    const auto onError = [this, made, expectedError](const IpcError& error) {
        ++made->outcomes;
        // What is no longer the font picker may be refused what it asked for as the font picker.
        const bool isExpected = error.name == ipc_errors::disconnected || expectedError == error.name ||
                                (isGone_ && error.name == ipc_errors::accessDenied);
        if (!isExpected) {
            world_.report(invariants::oneAnswer, name_,
                          made->member + " failed: " + error.name + " " + error.message);
        }
    };
    connection_->call(
        operation.interface, operation.member, std::move(arguments),
        [this, made, judge, isErrorExpected = expectedError.has_value()](Arguments results) {
            return judgeReply(this, made, judge, isErrorExpected, std::move(results));
        },
        onError);
    return made;
}

Task<void> SimulatedClient::judgeReply(SimulatedClient* self, std::shared_ptr<Call> call, Judge judge,
                                       bool isErrorExpected, Arguments results)
{
    ++call->outcomes;
    if (isErrorExpected) {
        self->world_.report(invariants::oneAnswer, self->name_, call->member + " was answered");
    }
    if (judge != nullptr) {
        (self->*judge)(results);
    }
    co_return;
}

bool SimulatedClient::seesOwn(const std::string& path) const
{
    return kind_.isProvider && font_directories::nameOfDirectoryHolding(path) == kind_.identifier;
}

Allowance SimulatedClient::allowance(bool isEnumerating, bool isAnswered) const
{
    Allowance allowed{token_, isAnswered, isEnumerating, kind_.hasFontAccess, process_.isSandboxed, {}, {}};
    const auto& everIssued = world_.everIssued[kind_.identifier.value_or("")];
    for (const auto& path : world_.registry.everEnabled()) {
        const bool isIssued = kind_.hasFontAccess && everIssued.contains(path) &&
                              (!process_.isSandboxed || needsNoGrant(path) || isGone_ ||
                               !process_.readablePaths.contains(path));
        if (isEnumerating || seesOwn(path) || isIssued) {
            allowed.paths.insert(path);
        }
    }
    if (kind_.isProvider && !isEnumerating) {
        allowed.ownDirectory = kind_.identifier;
    }
    return allowed;
}

void SimulatedClient::judgeReplyBy(const Arguments& results, bool isEnumerating, bool isAnswered)
{
    const auto reply = wire::fromNullable(std::get<PropertyList>(results.at(0)));
    const auto allowed = allowance(isEnumerating, isGone_ ? reply.has_value() && isAnswered : isAnswered);
    for (const auto& violation : violations(reply, allowed, world_.simulated.sandbox.issued())) {
        world_.report(invariants::share, name_, violation);
    }
}

void SimulatedClient::judgeCheckIn(const Arguments& results)
{
    judgeReplyBy(results, kind_.mayEnumerate, kind_.mayEnumerate || kind_.hasFontAccess || kind_.isProvider);
}

void SimulatedClient::judgePickerCheckIn(const Arguments& results)
{
    judgeReplyBy(results, true, kind_.isFontPicker);
}

std::set<std::string> SimulatedClient::exactPaths() const
{
    std::set<std::string> paths;
    const auto issued =
        world_.daemon->issuedPathsLedger().issuedFontFilePathsForIdentifier(kind_.identifier.value_or(""));
    for (const auto& path : world_.registry.enabled()) {
        const bool isIssued =
            kind_.hasFontAccess && std::ranges::find(issued, path) != issued.end() &&
            (!process_.isSandboxed || needsNoGrant(path) || !process_.readablePaths.contains(path));
        if (kind_.mayEnumerate || seesOwn(path) || isIssued) {
            paths.insert(path);
        }
    }
    return paths;
}

void SimulatedClient::judgeExactly(const Arguments& results)
{
    judgeCheckIn(results);
    const auto reply = wire::fromNullable(std::get<PropertyList>(results.at(0)));
    const auto* fonts = reply ? reply->find("fontsInfo")->asDictionary() : nullptr;
    std::set<std::string> listed;
    for (const auto& [path, entry] : fonts == nullptr ? PropertyList::Dictionary{} : *fonts) {
        listed.insert(path);
    }
    if (reply && listed != exactPaths()) {
        world_.report(invariants::share, name_,
                      "sees " + std::to_string(listed.size()) + " fonts instead of " +
                          std::to_string(exactPaths().size()));
    }
}

void SimulatedClient::checkInQuietly()
{
    if (!isGone_) {
        if (!connection_) {
            connect();
        }
        call(wire::checkin, {}, &SimulatedClient::judgeExactly);
    }
}

void SimulatedClient::judgeOutcomes()
{
    for (const auto& call : calls_) {
        const bool isStillConnected = call->connection == connection_;
        const int least = isStillConnected && !call->isNeverAnswered ? 1 : 0;
        const int most = isStillConnected && call->isNeverAnswered ? 0 : 1;
        if (call->outcomes < least || call->outcomes > most) {
            world_.report(invariants::oneAnswer, name_,
                          call->member + " came to " + std::to_string(call->outcomes) + " outcomes");
        }
    }
}

void SimulatedClient::disconnect()
{
    for (const auto& content : contents_) {
        content->vanish();
    }
    contents_.clear();
    if (connection_) {
        connection_->invalidate();
        connection_.reset();
    }
}

void SimulatedClient::becomeNobody()
{
    // The connection outlives the program that made it.
    world_.simulated.processes.exec(token_, {});
    isGone_ = true;
}

void SimulatedClient::vanish()
{
    world_.simulated.processes.exit(token_);
    world_.simulated.ipc.endProcess(token_);
    for (const auto& content : contents_) {
        content->vanish();
    }
    contents_.clear();
    connection_.reset();
    isGone_ = true;
}

}  // namespace typhon::simulation
