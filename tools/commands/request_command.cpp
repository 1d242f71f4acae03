#include "sdk/typhon_client.h"
#include "tools/commands/command.h"
#include "tools/font_table.h"
#include "tools/property_list_json.h"

namespace typhon {

namespace {

struct Options {
    std::vector<std::string> families;
    std::vector<std::string> postScriptNames;
};

int request(const Invocation& invocation, const Options& options)
{
    auto client = TyphonClient::connect({invocation.rootOption});
    if (!client) {
        return fail(client.error());
    }
    const auto fonts = client->requestFonts(options.families, options.postScriptNames);
    if (!fonts) {
        return fail(fonts.error());
    }
    const PropertyList view = PropertyList::Dictionary{{"fontsInfo", *fonts}};
    return invocation.json ? printJson(jsonOf(*fonts)) : print(checkinText(view));
}

}  // namespace

void addRequestCommand(CLI::App& parser, Invocation& invocation)
{
    addCommand<Options>(
        parser, invocation, "request", "Ask for fonts by name, which may ask the user, and show what came",
        request, [](CLI::App& command, Options& options) {
            command.add_option("--family", options.families, "A family name (repeatable)")
                ->type_name("NAME")
                ->allow_extra_args(false);
            command.add_option("--postscript", options.postScriptNames, "A PostScript name (repeatable)")
                ->type_name("NAME")
                ->allow_extra_args(false);
        });
}

}  // namespace typhon
