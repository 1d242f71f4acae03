#include "clients/typhon_handler.h"
#include "platform/font_directories.h"
#include "simulation/simulated_clients.h"

// What a client hears without having asked: changes of fonts, and what its content processes get.

namespace typhon::simulation {

namespace {

bool isInUserDirectories(const std::string& path)
{
    return path.starts_with(font_directories::fontFiles) || path.starts_with(font_directories::fontAssets);
}

}  // namespace

void SimulatedClient::hear(const HeardChange& change)
{
    heard_.push_back(change);
    const bool isEnumerating = kind_.mayEnumerate || kind_.isFontPicker;
    ChangeAllowance allowed{token_, isEnumerating, std::nullopt, {}};
    if (kind_.isProvider && !isEnumerating) {
        allowed.ownDirectory = kind_.identifier;
    }
    for (const auto& path : world_.registry.everEnabled()) {
        if (isEnumerating || seesOwn(path)) {
            allowed.paths.insert(path);
        }
    }
    for (const auto& violation : violations(change, allowed, world_.simulated.sandbox.issued())) {
        world_.report(invariants::share, name_, violation);
    }
}

void SimulatedClient::judgeHearing()
{
    if (isGone_) {
        return;
    }
    std::set<std::string> expected;
    for (const auto& path : world_.registry.enabled()) {
        if (isInUserDirectories(path) && (kind_.mayEnumerate || seesOwn(path))) {
            expected.insert(path);
        }
    }
    std::set<std::string> told;
    for (const auto& change : heard_) {
        const auto* fonts = change.info ? change.info->find("fontsInfo") : nullptr;
        for (const auto& [path, entry] :
             fonts == nullptr ? PropertyList::Dictionary{} : *fonts->asDictionary()) {
            told.insert(path);
        }
    }
    if (told != expected || heard_.size() != (expected.empty() ? 0U : 1U)) {
        world_.report(invariants::share, name_,
                      "heard of " + std::to_string(told.size()) + " fonts instead of " +
                          std::to_string(expected.size()) + " in " + std::to_string(heard_.size()) +
                          " messages");
    }
}

void SimulatedClient::checkInContent()
{
    const auto content = std::make_shared<SimulatedContent>(
        world_, [this](const SimulatedContent& process, const std::optional<PropertyList>& info) {
            judgeContent(process, info);
        });
    contents_.push_back(content);
    const auto made = call(wire::checkinForSilkpageProcess, {content->listen()});
    made->isNeverAnswered = !content->answers();
    if (pick(6) == 0) {
        content->vanish();
        made->isNeverAnswered = true;
    }
}

void SimulatedClient::judgeContent(const SimulatedContent& content, const std::optional<PropertyList>& info)
{
    // The font-registry library's helper is not answered when it checks in, but what it may do is remembered.
    const bool isHelper = TyphonHandler::isProcessIdentifierToIgnore(kind_.identifier);
    const bool isEnumerating = kind_.mayEnumerate || kind_.isFontPicker || isHelper;
    auto allowed = allowance(isEnumerating, info.has_value());
    allowed.token = content.token;
    allowed.isSandboxed = true;
    // It reads nothing by itself, whatever its host can read.
    if (kind_.isProvider) {
        const auto& issued = world_.everIssued[kind_.identifier.value_or("")];
        allowed.paths.insert(issued.begin(), issued.end());
    }
    for (const auto& violation : violations(info, allowed, world_.simulated.sandbox.issued())) {
        world_.report(invariants::share, name_ + "'s content", violation);
    }
}

}  // namespace typhon::simulation
