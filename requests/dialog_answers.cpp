#include "requests/dialog_answers.h"

#include <algorithm>

namespace typhon {

namespace {

const std::string* stringOf(const PropertyList& answer, const char* key)
{
    const auto* value = answer.find(key);
    return value == nullptr ? nullptr : value->asString();
}

}  // namespace

DialogAnswers::DialogAnswers(const PropertyList::Array& answers)
{
    for (const auto& answer : answers) {
        const auto* family = stringOf(answer, "uniqueID");
        const auto* provider = stringOf(answer, "installProvider");
        if (family != nullptr && provider != nullptr) {
            providerByFamily_.insert_or_assign(*family, *provider);
        }
    }
}

std::vector<std::string> DialogAnswers::families() const
{
    std::vector<std::string> families;
    for (const auto& [family, provider] : providerByFamily_) {
        families.push_back(family);
    }
    return families;
}

bool DialogAnswers::choose(const std::string& provider, const PropertyList& entry) const
{
    const auto* faces = entry.find("familyName");
    return faces != nullptr && std::ranges::any_of(*faces->asDictionary(), [&](const auto& face) {
               const auto found = providerByFamily_.find(*face.second.asString());
               return found != providerByFamily_.end() && found->second == provider;
           });
}

}  // namespace typhon
