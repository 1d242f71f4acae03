#include "tools/analytics_counts.h"
#include "tools/commands/command.h"
#include "tools/table.h"

namespace typhon {

namespace {

struct Options {};

nlohmann::json jsonOf(const AnalyticsCounts& counts)
{
    auto json = nlohmann::json::object();
    for (const auto& [application, count] : counts) {
        json[application] = {{"requests", count.requests},
                             {"misses", count.misses},
                             {"suggestions", count.suggestions},
                             {"resolved", count.resolved}};
    }
    return json;
}

std::string textOf(const AnalyticsCounts& counts)
{
    Table table({"Application", "Requests", "Unknown", "Switched off", "Satisfied"});
    for (const auto& [application, count] : counts) {
        table.addRow({application, std::to_string(count.requests), std::to_string(count.misses),
                      std::to_string(count.suggestions), std::to_string(count.resolved)});
    }
    return counts.empty() ? "No font was asked for since the machine was started.\n" : table.text();
}

int show(const Invocation& invocation, const Options&)
{
    const auto counts = analyticsCounts(invocation.root());
    if (!counts) {
        return fail(counts.error());
    }
    return invocation.json ? printJson(jsonOf(*counts)) : print(textOf(*counts));
}

}  // namespace

void addAnalyticsCommand(CLI::App& parser, Invocation& invocation)
{
    addCommand<Options>(parser, invocation, "analytics",
                        "Show who asked for fonts since the machine was started, and how many were there",
                        show, [](CLI::App&, Options&) {});
}

}  // namespace typhon
