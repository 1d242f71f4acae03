#include "sdk/typhon_client.h"
#include "tools/commands/command.h"
#include "tools/font_table.h"
#include "tools/property_list_json.h"

namespace typhon {

namespace {

struct Options {};

int checkin(const Invocation& invocation, const Options&)
{
    auto client = TyphonClient::connect({invocation.rootOption});
    if (!client) {
        return fail(client.error());
    }
    const auto view = client->checkin();
    if (!view) {
        return fail(view.error());
    }
    if (!*view) {
        return invocation.json ? printJson(nullptr)
                               : print("No fonts: this program has no share in the user's fonts (no valid "
                                       "signature, or one without a font entitlement).\n");
    }
    return invocation.json ? printJson(jsonOf(**view)) : print(checkinText(**view));
}

}  // namespace

void addCheckinCommand(CLI::App& parser, Invocation& invocation)
{
    addCommand<Options>(parser, invocation, "checkin", "Check in and show which fonts this program may see",
                        checkin, [](CLI::App&, Options&) {});
}

}  // namespace typhon
