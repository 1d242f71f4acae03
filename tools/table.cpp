#include "tools/table.h"

#include "platform/linux/visible_text.h"

#include <algorithm>
#include <string_view>

namespace typhon {

namespace {

/// Characters in UTF-8 text, which is what its columns are counted by.
std::size_t characterCount(std::string_view text)
{
    const auto begins = [](char byte) { return (static_cast<unsigned char>(byte) & 0xC0) != 0x80; };
    return static_cast<std::size_t>(std::count_if(text.begin(), text.end(), begins));
}

}  // namespace

Table::Table(std::vector<std::string> heading) : rows_{std::move(heading)} {}

void Table::addRow(std::vector<std::string> cells)
{
    cells.resize(rows_.front().size());
    for (auto& cell : cells) {
        cell = visibleText(cell);
    }
    rows_.push_back(std::move(cells));
}

std::string Table::text() const
{
    std::vector<std::size_t> widths(rows_.front().size());
    for (const auto& row : rows_) {
        for (std::size_t column = 0; column < row.size(); ++column) {
            widths[column] = std::max(widths[column], characterCount(row[column]));
        }
    }
    std::string text;
    for (const auto& row : rows_) {
        std::string line;
        for (std::size_t column = 0; column < row.size(); ++column) {
            line += row[column];
            line.append(widths[column] - characterCount(row[column]) + 2, ' ');
        }
        line.erase(line.find_last_not_of(' ') + 1);
        text += line + "\n";
    }
    return text;
}

}  // namespace typhon
