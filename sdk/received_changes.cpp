#include "sdk/received_changes.h"

#include "platform/file_url.h"
#include "protocol/wire.h"

namespace typhon {

namespace {

std::optional<std::vector<std::string>> stringsOrNull(const Argument& argument)
{
    const auto strings = wire::fromNullable(std::get<PropertyList>(argument));
    return strings ? std::optional(stringsOf(*strings)) : std::nullopt;
}

}  // namespace

void ReceivedChanges::add(const Arguments& arguments)
{
    FontChangeNotice notice{wire::fromNullable(std::get<PropertyList>(arguments.at(0))),
                            stringsOrNull(arguments.at(1)), stringsOrNull(arguments.at(2))};
    remember(notice);
    if (notices_.size() == most) {
        notices_.pop_front();
        ++lost_;
    }
    notices_.push_back(std::move(notice));
}

std::optional<FontChangeNotice> ReceivedChanges::take()
{
    if (notices_.empty()) {
        return std::nullopt;
    }
    auto notice = std::move(notices_.front());
    notices_.pop_front();
    return notice;
}

void ReceivedChanges::remember(const FontChangeNotice& notice)
{
    for (const auto& url : notice.removedURLStrings.value_or(std::vector<std::string>{})) {
        if (const auto path = pathFromFileUrl(url)) {
            fonts_.erase(*path);
        }
    }
    const auto* fonts = notice.info ? notice.info->find("fontsInfo") : nullptr;
    if (fonts != nullptr) {
        addFonts(*fonts);
    }
    if (const auto* extension = notice.info ? notice.info->find("extension.provider") : nullptr) {
        providerExtension_ = *extension;
    }
}

void ReceivedChanges::addFonts(const PropertyList& fonts)
{
    if (fonts.asDictionary() != nullptr) {
        for (const auto& [path, entry] : *fonts.asDictionary()) {
            fonts_.insert_or_assign(path, entry);
        }
    }
}

PropertyList ReceivedChanges::grants() const
{
    PropertyList::Dictionary grants{{"fontsInfo", fonts_}};
    if (providerExtension_) {
        grants.emplace("extension.provider", *providerExtension_);
    }
    return grants;
}

void ReceivedChanges::forgetGrants()
{
    fonts_.clear();
    providerExtension_.reset();
}

}  // namespace typhon
