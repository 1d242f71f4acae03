#include "platform/linux/linux_application_registry.h"
#include "tools/application_table.h"
#include "tools/commands/command.h"
#include "tools/complaints.h"

namespace typhon {

namespace {

struct Options {};

int applications(const Invocation& invocation, const Options&)
{
    Complaints complaints;
    LinuxApplicationRegistry registry(invocation.root(), complaints);
    const auto known = registry.applications();
    if (const auto complaint = complaints.text(); !complaint.empty()) {
        return fail(complaint, "Only an administrator may read the directories of all users; use sudo.");
    }
    return invocation.json ? printJson(applicationsJson(known)) : print(applicationsText(known));
}

}  // namespace

void addApplicationsCommand(CLI::App& parser, Invocation& invocation)
{
    addCommand<Options>(parser, invocation, "applications",
                        "Show the applications that the system knows, with their versions", applications,
                        [](CLI::App&, Options&) {});
}

}  // namespace typhon
