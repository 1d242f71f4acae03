#include "tools/agent/dialog_picture.h"

#include "tools/agent/display_text.h"

#include <algorithm>

#include <fmt/format.h>

namespace typhon {

namespace {

constexpr std::size_t fewestColumns = 20;

std::string choiceText(const MissingFontsChoice::Row& row)
{
    if (!row.isAvailable()) {
        return "not available";
    }
    return row.chosen ? row.providers[*row.chosen] : "leave off";
}

std::string rowText(const MissingFontsChoice::Row& row, bool isSelected, std::size_t columns)
{
    const std::size_t frame = 8;
    const auto nameWidth = (columns - frame) / 2;
    const auto choiceWidth = columns - frame - nameWidth;
    const auto choice = displayField(choiceText(row), choiceWidth);
    return fmt::format("{} {}{}{}{}", isSelected ? '>' : ' ', displayField(row.displayName, nameWidth),
                       row.isAvailable() ? "  < " : "    ", choice, row.isAvailable() ? " >" : "  ");
}

/// The first of the rows that are shown, when `room` of them fit.
std::size_t firstShown(const MissingFontsChoice& choice, std::size_t room)
{
    const auto count = choice.rows().size();
    const auto selected = choice.selected().value_or(0);
    const auto first = selected < room / 2 ? 0 : selected - room / 2;
    return count <= room ? 0 : std::min(first, count - room);
}

std::string countText(const MissingFontsChoice& choice, std::size_t first, std::size_t shown)
{
    const auto count = choice.rows().size();
    return count <= shown ? fmt::format("{} missing font{}", count, count == 1 ? "" : "s")
                          : fmt::format("missing fonts {} to {} of {}", first + 1, first + shown, count);
}

const char* keysText(const MissingFontsChoice& choice, std::size_t shown)
{
    if (choice.hasChoice()) {
        return "Up/Down: font  Left/Right: provider  Enter: done  Esc: none of them";
    }
    return shown < choice.rows().size() ? "Up/Down: font  Enter: done" : "Enter: done";
}

}  // namespace

std::vector<std::string> dialogPicture(const MissingFontsChoice& choice, const TerminalSize& size,
                                       bool marked)
{
    const auto columns = std::max(size.columns, fewestColumns);
    const std::size_t around = 6;
    const auto room = size.lines > around ? size.lines - around : 1;
    const auto first = firstShown(choice, room);
    const auto shown = std::min(room, choice.rows().size() - first);

    std::vector<std::string> lines{displayText("A document needs fonts that are missing", columns),
                                   displayText(countText(choice, first, shown), columns), ""};
    for (auto index = first; index < first + shown; ++index) {
        const bool isSelected =
            choice.selected() == index && (choice.hasChoice() || shown < choice.rows().size());
        auto text = rowText(choice.rows()[index], isSelected, columns);
        lines.push_back(isSelected && marked ? "\x1B[7m" + text + "\x1B[0m" : text);
    }
    lines.emplace_back();
    lines.push_back(displayText(keysText(choice, shown), columns));
    return lines;
}

}  // namespace typhon
