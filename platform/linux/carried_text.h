#pragma once

#include "platform/property_list.h"

#include <deque>
#include <string>
#include <string_view>

namespace typhon {

/// What text a form of property list can carry.
enum class CarriedText {
    /// Valid UTF-8.
    unicode,
    /// The same, of the characters that XML allows.
    xml,
};

bool isCarried(std::string_view text, CarriedText carried);
/// With U+FFFD for everything that is not carried.
std::string replacingUncarried(std::string_view text, CarriedText carried);

/// A dictionary with keys that are carried, for writing: the original nearly always, else a changed copy.
class CarriedKeys {
public:
    explicit CarriedKeys(CarriedText carried) : carried_(carried) {}
    /// The result lives as long as `dictionary` and this object.
    const PropertyList::Dictionary& operator()(const PropertyList::Dictionary& dictionary);

private:
    const CarriedText carried_;
    std::deque<PropertyList::Dictionary> copies_;
};

}  // namespace typhon
