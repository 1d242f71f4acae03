#include "tools/commands/command.h"
#include "tools/kept_provider.h"

#include <string>

namespace typhon {

namespace {

struct Options {
    std::string identifier;
    bool undo = false;
};

int keep(const Invocation& invocation, const Options& options)
{
    const auto outcome = options.undo ? dropKeptProvider(invocation.root(), options.identifier)
                                      : keepProvider(invocation.root(), options.identifier);
    if (outcome.error) {
        return fail(*outcome.error,
                    "Only an administrator may keep providers; use sudo, or --root for a scratch "
                    "system of your own.");
    }
    if (invocation.json) {
        return printJson({{options.undo ? "dropped" : "kept", options.identifier}, {"entry", outcome.path}});
    }
    return print(options.undo ? "No longer kept: its fonts will be removed.\n"
                              : "Kept by " + outcome.path + "\n");
}

void declare(CLI::App& command, Options& options)
{
    command.add_flag("--undo", options.undo, "Keep it no longer");
    command.add_option("identifier", options.identifier, "The provider's identifier")
        ->required()
        ->type_name("ID");
}

}  // namespace

void addKeepProviderCommand(CLI::App& parser, Invocation& invocation)
{
    addCommand<Options>(parser, invocation, "keep-provider",
                        "Keep the fonts of a provider that is no installed application", keep, declare);
}

}  // namespace typhon
