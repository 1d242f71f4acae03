#include "clients/font_change.h"

#include "platform/file_url.h"

namespace typhon {

FontChange::FontChange(const PropertyList& description)
{
    const auto* added = description.find("added");
    const auto* kind = description.find("kind");
    const auto* urls = description.find("urls");
    isAdded_ = added != nullptr && added->isTrue();
    const auto* number = kind == nullptr ? nullptr : kind->asInteger();
    isOfUserFonts_ = number == nullptr || *number == 0;
    if (urls != nullptr && urls->asArray() != nullptr) {
        readFonts(*urls->asArray());
    }
}

void FontChange::readFonts(const PropertyList::Array& urls)
{
    std::size_t length = 0;
    for (std::size_t index = 0; index < urls.size(); ++index) {
        const auto* url = urls[index].asString();
        auto path = url == nullptr ? std::nullopt : pathFromFileUrl(*url);
        if (!path) {
            continue;
        }
        length += url->size();
        if (fonts_.size() == mostFonts || length > longestUrls) {
            leftOut_ = urls.size() - index;
            return;
        }
        fonts_.push_back({*url, *std::move(path)});
    }
}

}  // namespace typhon
