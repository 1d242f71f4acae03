#include "requests/font_requests.h"

#include "requests/request_description.h"

#include <algorithm>
#include <exception>
#include <string_view>

namespace typhon {

namespace {

bool contains(const PropertyList& array, std::string_view text)
{
    const auto* members = array.asArray();
    return members != nullptr && std::ranges::find(*members, PropertyList(text)) != members->end();
}

}  // namespace

FontRequests::FontRequests(const Services& services)
    : platform_(services.platform), mainHandlerQueue_(services.mainHandlerQueue),
      counters_(services.platform.preferences),
      gate_(services.platform), services_{services.platform,
                                          services.registry,
                                          services.perClientFontInfo,
                                          services.resolution,
                                          services.ledger,
                                          services.dialog,
                                          counters_,
                                          gate_}
{}

Task<void> FontRequests::requestFonts(PropertyList::Array requests, DictionaryReply reply)
{
    auto requester = admitted();
    if (!requester) {
        // Intended: a refused application is never named, also when it could be.
        systemLog(platform_.log, "Application \"(null)\" does not have an entitlement to use custom fonts.");
        reply({});
        co_return;
    }
    auto entering = gate_.enter(requester->signingIdentifier);
    co_await std::move(entering);
    auto turn = takeTurn(*std::move(requester), std::move(requests), std::move(reply));
    co_await std::move(turn);
}

Task<void> FontRequests::takeTurn(FontRequester requester, PropertyList::Array requests,
                                  DictionaryReply reply)
{
    const auto request = std::make_shared<FontRequest>(services_, std::move(requester), std::move(reply));
    TYLog_Debug(platform_.log, "requestFonts -  " + descriptionOf(requests));
    std::exception_ptr failure;
    try {
        auto resolving = mainHandlerQueue_.perform(FontRequest::resolve(request, std::move(requests)));
        co_await std::move(resolving);
    } catch (...) {
        failure = std::current_exception();
    }
    if (failure) {
        auto completing = FontRequest::complete(request);
        co_await std::move(completing);
        std::rethrow_exception(failure);
    }
}

std::optional<FontRequester> FontRequests::admitted()
{
    const auto token = currentAuditToken();
    const auto task = platform_.codeSigning.taskFromAuditToken(token);
    const auto userFonts = task ? task->entitlement("com.vorlan.developer.user-fonts") : std::nullopt;
    // Intended: the privacy list is not asked here.
    const bool hasEnumeration = userFonts && contains(*userFonts, "font-enumeration");
    const bool hasUsage = userFonts && contains(*userFonts, "app-usage");
    if ((!hasEnumeration && !hasUsage) || !task->signingIdentifier) {
        return std::nullopt;
    }
    return FontRequester{token, *task->signingIdentifier, hasEnumeration};
}

}  // namespace typhon
