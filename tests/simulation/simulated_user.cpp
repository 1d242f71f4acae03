#include "simulation/simulated_user.h"

#include "protocol/wire.h"

#include <algorithm>
#include <array>

namespace typhon::simulation {

namespace {

constexpr AuditToken viewService{
    .version = 1, .processIdentifier = 9, .processInstance = 9, .execGeneration = 1, .bootEpoch = 1};

constexpr std::array families{"Alpha", "Beta", "Nowhere"};
constexpr std::array providers{"com.example.provider", "com.example.suite", "com.example.other",
                               "com.example.stranger"};

}  // namespace

void SimulatedUser::act()
{
    if (dialogs() != 0) {
        const auto back = std::min<std::size_t>(pick(3), dialogs() - 1);
        answer(dialogs() - 1 - back);
    }
}

void SimulatedUser::answerWhatIsUp()
{
    if (dialogs() != 0 && !hasAnswered(dialogs() - 1)) {
        answer(dialogs() - 1);
    }
}

void SimulatedUser::answer(std::size_t dialog)
{
    PropertyList::Array answers;
    for (auto count = pick(4); count != 0; --count) {
        answers.push_back(someAnswer());
    }
    const auto connection = connectionTo(dialog);
    answered_.insert(dialog);
    connection->call(wire::doneWithMissingFonts.interface, wire::doneWithMissingFonts.member,
                     {PropertyList(std::move(answers))}, nullptr, nullptr);
}

PropertyList SimulatedUser::someAnswer()
{
    const std::string family = families[pick(families.size())];
    const std::string provider = providers[pick(providers.size())];
    switch (pick(6)) {
    case 0:
        return PropertyList::Dictionary{{"uniqueID", family}};
    case 1:
        return PropertyList::Dictionary{{"uniqueID", 7}, {"installProvider", provider}};
    default:
        history_.chosen.emplace(family, provider);
        return PropertyList::Dictionary{{"uniqueID", family}, {"installProvider", provider}};
    }
}

std::shared_ptr<Connection> SimulatedUser::connectionTo(std::size_t dialog)
{
    auto& open = connections_[dialog];
    if (open.empty() || pick(4) == 0) {
        open.push_back(world_.simulated.remoteAlerts.connectViewService(
            dialog, viewService, wire::fontInstallViewServiceInterfaces()));
    }
    return open[pick(open.size())];
}

void SimulatedUser::leave()
{
    for (const auto& [dialog, connections] : connections_) {
        for (const auto& connection : connections) {
            connection->invalidate();
        }
    }
    connections_.clear();
}

}  // namespace typhon::simulation
