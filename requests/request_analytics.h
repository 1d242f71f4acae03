#pragma once

#include "platform/analytics.h"

#include <cstddef>
#include <string>

namespace typhon {

/// `analyticsEventRequestFonts:misses:suggestions:resolved:`. Offers the one event of a font request of that
/// application: how many of its names are unknown, how many families are switched off, and how many are
/// there. Any thread.
void analyticsEventRequestFonts(Analytics& analytics, std::string identifier, std::size_t misses,
                                std::size_t suggestions, std::size_t resolved);

}  // namespace typhon
