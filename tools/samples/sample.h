#pragma once

#include "sdk/typhon_client.h"

#include <cstddef>
#include <optional>
#include <string_view>

namespace typhon::sample {

/// Who this sample application is.
inline constexpr std::string_view identifier = TYPHON_SAMPLE_IDENTIFIER;

using View = std::optional<PropertyList>;

/// Says what went wrong and gives the exit code for it.
int complain(const ClientError& error);
/// Checks in as what it is.
ClientResult<View> checkIn(TyphonClient& client);
/// The fonts that came with a check-in or a change, by path.
PropertyList::Dictionary fontsIn(const PropertyList& view);

/// Prints every change of fonts that it is told of, and reads what came. Ends after `count`, if above zero.
int monitor(TyphonClient& client, unsigned long count);

/// Starts a content process, hands over its endpoint, and lets it read what it gets.
int showContent(TyphonClient& client);

}  // namespace typhon::sample
