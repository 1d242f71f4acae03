#include "tools/agent/missing_fonts_choice.h"

#include <algorithm>

namespace typhon {

namespace {

std::optional<std::string> textIn(const PropertyList& record, std::string_view key)
{
    const auto* value = record.find(key);
    const auto* text = value == nullptr ? nullptr : value->asString();
    return text == nullptr ? std::nullopt : std::optional(*text);
}

const PropertyList::Array& arrayIn(const PropertyList& record, std::string_view key)
{
    static const PropertyList::Array none;
    const auto* value = record.find(key);
    const auto* array = value == nullptr ? nullptr : value->asArray();
    return array == nullptr ? none : *array;
}

std::vector<std::string> providersIn(const PropertyList& record)
{
    std::vector<std::string> providers;
    for (const auto& provider : arrayIn(record, "providers")) {
        if (const auto* text = provider.asString();
            text != nullptr && providers.size() < MissingFontsChoice::mostProviders) {
            providers.push_back(*text);
        }
    }
    // They come in any order.
    std::ranges::sort(providers);
    return providers;
}

}  // namespace

MissingFontsChoice::MissingFontsChoice(const PropertyList& userInfo)
{
    for (const auto& record : arrayIn(userInfo, "fonts")) {
        auto name = textIn(record, "displayName");
        if (!name || rows_.size() == mostRows) {
            continue;
        }
        rows_.push_back({*std::move(name), providersIn(record), textIn(record, "uniqueID"), std::nullopt});
    }
    const auto first = std::ranges::find_if(rows_, &Row::isAvailable);
    if (!rows_.empty()) {
        selected_ = first == rows_.end() ? 0 : static_cast<std::size_t>(first - rows_.begin());
    }
}

bool MissingFontsChoice::hasChoice() const
{
    return std::ranges::any_of(rows_, &Row::isAvailable);
}

void MissingFontsChoice::selectNext()
{
    if (selected_ && *selected_ + 1 < rows_.size()) {
        ++*selected_;
    }
}

void MissingFontsChoice::selectPrevious()
{
    if (selected_ && *selected_ > 0) {
        --*selected_;
    }
}

void MissingFontsChoice::turn(std::size_t steps)
{
    if (!selected_ || !rows_[*selected_].isAvailable()) {
        return;
    }
    auto& row = rows_[*selected_];
    // Position 0 is off.
    const auto positions = row.providers.size() + 1;
    const auto position = (row.chosen ? *row.chosen + 1 : 0) + steps;
    const auto next = position % positions;
    row.chosen = next == 0 ? std::nullopt : std::optional(next - 1);
}

void MissingFontsChoice::nextProvider()
{
    turn(1);
}

void MissingFontsChoice::previousProvider()
{
    if (selected_) {
        turn(rows_[*selected_].providers.size());
    }
}

void MissingFontsChoice::chooseFirst()
{
    for (auto& row : rows_) {
        row.chosen = row.isAvailable() ? std::optional<std::size_t>(0) : std::nullopt;
    }
}

PropertyList::Array MissingFontsChoice::answer() const
{
    PropertyList::Array answers;
    for (const auto& row : rows_) {
        if (row.isAvailable() && row.chosen) {
            answers.push_back(PropertyList::Dictionary{{"uniqueID", *row.uniqueID},
                                                       {"installProvider", row.providers[*row.chosen]}});
        }
    }
    return answers;
}

}  // namespace typhon
