#pragma once

#include "comparison.h"

#include <string>
#include <vector>

namespace typhon::bench {

enum class Unit { seconds, bytes };

/// One line of the table.
struct Row {
    std::string work;
    std::string peer;
    Comparison comparison;
    /// The greatest ratio that is good enough.
    double toReach = 0;
    Unit unit = Unit::seconds;
};

/// Collects the rows, says on standard error what is being measured, and prints the table.
class Report {
public:
    /// Announces what takes a while.
    static void begin(const std::string& work);
    void add(Row row);
    /// A figure that stands by itself, without a peer.
    void addFigure(const std::string& what, const Summary& summary, Unit unit = Unit::seconds);
    /// The table in Markdown on standard output, and the figures below it.
    void print() const;

private:
    std::vector<Row> rows_;
    std::vector<std::string> figures_;
};

}  // namespace typhon::bench
