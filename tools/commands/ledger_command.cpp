#include "platform/linux/linux_preferences.h"
#include "tools/commands/command.h"
#include "tools/complaints.h"
#include "tools/ledger_text.h"
#include "tools/property_list_json.h"

namespace typhon {

namespace {

struct Options {};

int ledger(const Invocation& invocation, const Options&)
{
    Complaints complaints;
    LinuxPreferences preferences(invocation.root(), complaints);
    const auto issues = expandedLedger(preferences.dictionary("issues"));
    if (const auto complaint = complaints.text(); !complaint.empty()) {
        return fail(complaint, "Only an administrator may read the daemon's preferences; use sudo.");
    }
    return invocation.json ? printJson(jsonOf(issues)) : print(ledgerText(issues));
}

}  // namespace

void addLedgerCommand(CLI::App& parser, Invocation& invocation)
{
    addCommand<Options>(parser, invocation, "ledger",
                        "Show which font files were issued to which application", ledger,
                        [](CLI::App&, Options&) {});
}

}  // namespace typhon
