#include "simulation/requesting_application.h"

#include "requests/font_name_resolution.h"
#include "simulation/allowance.h"

#include <algorithm>

namespace typhon::simulation {

using Array = PropertyList::Array;
using Dictionary = PropertyList::Dictionary;

RequestingApplication::RequestingApplication(World& world, RequestHistory& history, const ClientKind& kind)
    : world_(world), history_(history), kind_(kind)
{
    process_.signingIdentifier = kind.identifier;
    process_.entitlements = kind.entitlements;
    process_.isSandboxed = pick(4) != 0;
    process_.acceptsExtensions = pick(6) != 0;
    if (pick(2) == 0) {
        process_.readablePaths.insert(world.registry.somePath());
    }
    token_ = world.simulated.processes.add(process_);
    world.simulated.processLifecycle.setVisible(token_, pick(3) != 0);
    name_ = "requesting " + kind.name + " " + std::to_string(token_.processIdentifier);
}

bool RequestingApplication::holds(const std::string& entitlement) const
{
    const auto found = kind_.entitlements.find("com.vorlan.developer.user-fonts");
    return found != kind_.entitlements.end() && kind_.identifier &&
           std::ranges::count(stringsOf(found->second), entitlement) != 0;
}

void RequestingApplication::connect()
{
    connection_ = world_.simulated.ipc.connectClient(wire::serviceName, token_);
    connection_->setRemoteObjectInterfaces(wire::typhonDaemonInterfaces());
    connection_->resume();
}

void RequestingApplication::act()
{
    const auto what = pick(16);
    if (what == 0) {
        disconnect();
    } else if (what == 1) {
        vanish();
    } else if (what == 2) {
        becomeNobody();
    } else if (what == 3) {
        world_.simulated.processLifecycle.setVisible(token_, pick(2) == 0);
    } else if (!isGone_ || connection_) {
        if (!connection_) {
            connect();
        }
        what < 6 ? checkIn() : request();
    }
}

/// A name of either kind; adds the families that it may stand for.
std::string RequestingApplication::someName(std::set<std::string>& families, bool isFamily)
{
    const auto& names = isFamily ? SimulatedRegistry::familyNames() : SimulatedRegistry::postScriptNames();
    const auto choice = pick(names.size() + 1);
    if (choice == names.size()) {
        return "Nowhere";
    }
    if (isFamily) {
        families.insert(names[choice]);
    } else {
        families.merge(SimulatedRegistry::familiesOf(names[choice]));
    }
    return names[choice];
}

PropertyList RequestingApplication::someRequest(std::set<std::string>& families)
{
    Dictionary request;
    if (pick(8) == 0) {
        request.emplace(kLFFontFamilyNameAttribute, 7);
    } else if (pick(2) == 0) {
        request.emplace(kLFFontFamilyNameAttribute, someName(families, true));
    }
    if (pick(2) == 0) {
        request.emplace(kLFFontNameAttribute, someName(families, false));
    }
    return request;
}

void RequestingApplication::request()
{
    const auto call = std::make_shared<Call>(Call{connection_, {}});
    Array requests;
    for (auto count = pick(4); count != 0; --count) {
        requests.push_back(someRequest(call->families));
    }
    auto& asked = history_.familiesAskedFor[kind_.identifier.value_or("")];
    asked.insert(call->families.begin(), call->families.end());
    start(wire::requestFonts, {PropertyList(std::move(requests))}, call);
}

void RequestingApplication::checkIn()
{
    start(wire::checkin, {}, std::make_shared<Call>(Call{connection_, {}, true}));
}

void RequestingApplication::start(const wire::Operation& operation, Arguments arguments,
                                  std::shared_ptr<Call> call)
{
    calls_.push_back(call);
    connection_->call(
        operation.interface, operation.member, std::move(arguments),
        [this, call](Arguments results) { return judge(this, call, std::move(results)); },
        [this, call](const IpcError& error) {
            ++call->outcomes;
            if (error.name != ipc_errors::disconnected) {
                world_.report(invariants::oneAnswer, name_,
                              "a call failed: " + error.name + " " + error.message);
            }
        });
}

Task<void> RequestingApplication::judge(RequestingApplication* self, std::shared_ptr<Call> call,
                                        Arguments results)
{
    ++call->outcomes;
    const auto& result = std::get<PropertyList>(results.at(0));
    if (call->isCheckin) {
        self->judgeCheckIn(wire::fromNullable(result));
    } else {
        self->judgeRequest(*call, result);
    }
    co_return;
}

void RequestingApplication::judgeRequest(const Call& call, const PropertyList& fonts)
{
    if (holds("app-usage") || holds("font-enumeration")) {
        judgeFonts(fonts, call.families, holds("font-enumeration"));
    } else if (!fonts.asDictionary()->empty()) {
        world_.report(invariants::share, name_, "fonts for somebody who may not ask for any");
    }
}

void RequestingApplication::judgeCheckIn(const std::optional<PropertyList>& reply)
{
    // Those who see fonts by other rights than requests are judged elsewhere.
    if (reply && !kind_.mayEnumerate && !kind_.isProvider) {
        judgeFonts(*reply->find("fontsInfo"), history_.familiesAskedFor[kind_.identifier.value_or("")],
                   false);
    }
}

void RequestingApplication::judgeFonts(const PropertyList& fonts, const std::set<std::string>& families,
                                       bool isEnumerating)
{
    Allowance allowed{token_, true, isEnumerating, true, process_.isSandboxed, {}, {}};
    for (const auto& [path, entry] : *fonts.asDictionary()) {
        if (history_.mayGive(world_.registry, families, path)) {
            allowed.paths.insert(path);
        }
    }
    const PropertyList reply = Dictionary{{"fontsInfo", fonts}};
    for (const auto& violation : violations(reply, allowed, world_.simulated.sandbox.issued())) {
        world_.report(invariants::share, name_, violation);
    }
}

void RequestingApplication::judgeOutcomes()
{
    for (const auto& call : calls_) {
        const int least = call->connection == connection_ ? 1 : 0;
        if (call->outcomes < least || call->outcomes > 1) {
            world_.report(invariants::oneAnswer, name_,
                          "a call came to " + std::to_string(call->outcomes) + " outcomes");
        }
    }
}

void RequestingApplication::disconnect()
{
    if (connection_) {
        connection_->invalidate();
        connection_.reset();
    }
}

void RequestingApplication::becomeNobody()
{
    world_.simulated.processes.exec(token_, {});
    isGone_ = true;
}

void RequestingApplication::vanish()
{
    world_.simulated.processes.exit(token_);
    world_.simulated.ipc.endProcess(token_);
    connection_.reset();
    isGone_ = true;
}

}  // namespace typhon::simulation
