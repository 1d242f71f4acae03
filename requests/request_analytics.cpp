#include "requests/request_analytics.h"

#include <cstdint>

namespace typhon {

namespace {

PropertyList count(std::size_t number)
{
    return static_cast<std::int64_t>(number);
}

}  // namespace

void analyticsEventRequestFonts(Analytics& analytics, std::string identifier, std::size_t misses,
                                std::size_t suggestions, std::size_t resolved)
{
    analytics.sendEventLazily(
        "com.vorlan.font-privacy", [identifier = std::move(identifier), misses, suggestions, resolved] {
            return PropertyList(PropertyList::Dictionary{{"name", identifier},
                                                         {"misses", count(misses)},
                                                         {"suggestions", count(suggestions)},
                                                         {"resolved", count(resolved)}});
        });
}

}  // namespace typhon
