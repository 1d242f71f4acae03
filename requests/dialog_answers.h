#pragma once

#include "platform/property_list.h"

#include <map>
#include <string>
#include <vector>

namespace typhon {

/// What the user chose in a missing-fonts dialog, out of answers that may be anything: those without a
/// "uniqueID" are skipped, and of several for one family the last provider counts.
class DialogAnswers {
public:
    explicit DialogAnswers(const PropertyList::Array& answers);

    /// The families for which an application was chosen to provide them.
    std::vector<std::string> families() const;

    /// Whether that application was chosen to provide one of the families of a registry entry.
    bool choose(const std::string& provider, const PropertyList& entry) const;

private:
    std::map<std::string, std::string, std::less<>> providerByFamily_;
};

}  // namespace typhon
