#pragma once

#include "platform/property_list.h"

#include <string>

namespace typhon::bench {

/// A registry with that many font files of one face each, of 20 providers; every seventh is switched off.
PropertyList sampleRegistry(int fonts);

/// The logical path of the font file of that number in it.
std::string sampleFontPath(int index);

}  // namespace typhon::bench
