#include "report.h"

#include <fmt/format.h>

namespace typhon::bench {

namespace {

std::string amount(double value, Unit unit)
{
    if (unit == Unit::bytes) {
        return value < 10'000 ? fmt::format("{:.0f} B", value) : fmt::format("{:.1f} kB", value / 1e3);
    }
    if (value < 1e-6) {
        return fmt::format("{:.0f} ns", value * 1e9);
    }
    if (value < 1e-3) {
        return fmt::format("{:.2f} us", value * 1e6);
    }
    return value < 1 ? fmt::format("{:.2f} ms", value * 1e3) : fmt::format("{:.2f} s", value);
}

std::string spread(const Summary& summary, Unit unit)
{
    return fmt::format("{} ({} to {})", amount(summary.median, unit), amount(summary.lowerQuartile, unit),
                       amount(summary.upperQuartile, unit));
}

}  // namespace

void Report::begin(const std::string& work)
{
    fmt::print(stderr, "{} ...\n", work);
}

void Report::add(Row row)
{
    rows_.push_back(std::move(row));
}

void Report::addFigure(const std::string& what, const Summary& summary, Unit unit)
{
    figures_.push_back(fmt::format("{}: {}", what, spread(summary, unit)));
}

void Report::print() const
{
    fmt::print(
        "| Work | Beside | Ours: median (quartiles) | Peer: median (quartiles) | Ratio | To reach | |\n");
    fmt::print("|---|---|---|---|---|---|---|\n");
    for (const auto& row : rows_) {
        const double ratio = row.comparison.ratio();
        fmt::print("| {} | {} | {} | {} | {:.2f} | {:.2f} | {} |\n", row.work, row.peer,
                   spread(row.comparison.ours, row.unit), spread(row.comparison.peer, row.unit), ratio,
                   row.toReach, ratio <= row.toReach ? "reached" : "NOT reached");
    }
    for (const auto& figure : figures_) {
        fmt::print("\n{}\n", figure);
    }
}

}  // namespace typhon::bench
