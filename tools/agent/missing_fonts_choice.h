#pragma once

#include "platform/property_list.h"

#include <cstddef>
#include <optional>
#include <string>
#include <vector>

namespace typhon {

/// The logic of the missing-fonts dialog, without a face: its rows, which one is selected, what was chosen
/// for each, and the answer that follows from that. One thread.
class MissingFontsChoice {
public:
    /// More are not shown.
    static constexpr std::size_t mostRows = 10'000;
    static constexpr std::size_t mostProviders = 256;

    struct Row {
        /// As it came: hostile text, for a face to make harmless.
        std::string displayName;
        std::vector<std::string> providers;
        /// Names the row in the answer; null for a font that nobody has.
        std::optional<std::string> uniqueID;
        /// The provider that shall supply the font; null to leave it off.
        std::optional<std::size_t> chosen;

        bool isAvailable() const { return uniqueID && !providers.empty(); }
    };

    /// From the user info of an alert. What is malformed in it is left out.
    explicit MissingFontsChoice(const PropertyList& userInfo);

    const std::vector<Row>& rows() const { return rows_; }
    /// The selected row, at first the first that offers a choice; null when there are no rows.
    std::optional<std::size_t> selected() const { return selected_; }
    /// Whether any row offers a choice.
    bool hasChoice() const;

    /// Selects the next or previous row, whatever it offers, so that a face can show them all, and stays
    /// where there is none.
    void selectNext();
    void selectPrevious();
    /// Goes through what the selected row offers, if it does, in a circle: off, then each provider.
    void nextProvider();
    void previousProvider();
    /// Chooses the first provider of every row.
    void chooseFirst();

    /// For `doneWithMissingFonts:`: "uniqueID" and "installProvider" of every row with a provider chosen.
    PropertyList::Array answer() const;

private:
    void turn(std::size_t steps);

    std::vector<Row> rows_;
    std::optional<std::size_t> selected_;
};

}  // namespace typhon
