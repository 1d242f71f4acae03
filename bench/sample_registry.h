#pragma once

#include "platform/property_list.h"

#include <string>

namespace typhon::bench {

inline constexpr int sampleProviders = 20;
/// The identifier of a provider by its number.
std::string sampleProvider(int number);

/// A registry with that many font files of one face each, of all providers in turn; every seventh is switched
/// off.
PropertyList sampleRegistry(int fonts);

// Of the font file of that number in it:

/// Its logical path.
std::string sampleFontPath(int index);
/// The family of its face, which it shares with three others.
std::string sampleFamilyName(int index);
/// The PostScript name of its face.
std::string samplePostScriptName(int index);

}  // namespace typhon::bench
