#pragma once

#include "sdk/typhon_client.h"

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

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

void printFont(const std::string& path, const PropertyList& entry);
/// Opens a font through its grant and prints the names in it. True when it could be opened and is a font.
bool readFont(TyphonClient& client, const std::string& path);

/// Asks for the fonts of names, given as options, and reads those that come.
int requestFonts(TyphonClient& client, const std::vector<std::string>& words);

/// Makes an endpoint for the font picker, passes it on over the socket that standard input is, and reads the
/// fonts that were picked.
int receivePicked();

/// Passes a descriptor on over a Unix socket.
bool sendDescriptor(int socket, int descriptor);

/// Prints every change of fonts that it is told of, and reads what came. Ends after `count`, if above zero.
int monitor(TyphonClient& client, unsigned long count);

/// Starts a content process, hands over its endpoint, and lets it read what it gets.
int showContent(TyphonClient& client);

}  // namespace typhon::sample
