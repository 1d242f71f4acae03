#pragma once

#include <cstddef>
#include <string>
#include <vector>

namespace typhon {

/// A table for people: columns as wide as their widest cell, two blanks between them, nothing after the
/// last one. Cells are made visible (see visibleText). Rows shorter than the heading are filled up.
class Table {
public:
    explicit Table(std::vector<std::string> heading);
    void addRow(std::vector<std::string> cells);
    std::size_t rowCount() const { return rows_.size() - 1; }
    /// Lines with a final newline, the heading first.
    std::string text() const;

private:
    std::vector<std::vector<std::string>> rows_;
};

}  // namespace typhon
