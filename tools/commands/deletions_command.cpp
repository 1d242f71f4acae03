#include "platform/linux/linux_clock.h"
#include "platform/linux/linux_preferences.h"
#include "tools/commands/command.h"
#include "tools/complaints.h"
#include "tools/deletions_text.h"
#include "tools/property_list_json.h"

namespace typhon {

namespace {

struct Options {};

int deletions(const Invocation& invocation, const Options&)
{
    Complaints complaints;
    LinuxPreferences preferences(invocation.root(), complaints);
    const auto schedule = plainSchedule(preferences.dictionary("delete"));
    if (const auto complaint = complaints.text(); !complaint.empty()) {
        return fail(complaint, "Only an administrator may read the daemon's preferences; use sudo.");
    }
    return invocation.json ? printJson(jsonOf(schedule)) : print(deletionsText(schedule, LinuxClock().now()));
}

}  // namespace

void addDeletionsCommand(CLI::App& parser, Invocation& invocation)
{
    addCommand<Options>(parser, invocation, "deletions",
                        "Show which font files are scheduled for deletion, and when", deletions,
                        [](CLI::App&, Options&) {});
}

}  // namespace typhon
