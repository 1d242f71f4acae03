#include "sdk/client_errors.h"
#include "tools/commands/command.h"
#include "tools/commands/font_changes.h"
#include "tools/font_table.h"
#include "tools/property_list_file.h"
#include "tools/property_list_json.h"

namespace typhon {

namespace {

constexpr const char* registryPath = "/var/mobile/Library/UserFonts/UserFonts.plist";

struct Options {};

/// A system on which no font was ever installed has no registry file.
ClientResult<PropertyList> readRegistry(const std::string& path)
{
    const auto registry = readPropertyListFile(path);
    return !registry && registry.error().name == client_errors::fileNotFound ? PropertyList() : registry;
}

int list(const Invocation& invocation, const Options&)
{
    const auto registry = readRegistry(invocation.root().real(registryPath));
    if (!registry) {
        return fail(registry.error().message, "Only an administrator may read the registry; use sudo. What "
                                              "this program may see: typhonctl checkin");
    }
    if (registry->asDictionary() == nullptr) {
        return fail(std::string(registryPath) + " holds no dictionary",
                    "Restore the registry from a backup.");
    }
    return invocation.json ? printJson(jsonOf(*registry)) : print(registryText(*registry));
}

}  // namespace

void addFontsCommand(CLI::App& parser, Invocation& invocation)
{
    CLI::App& command = *parser.add_subcommand("fonts", "The fonts installed on this system");
    command.require_subcommand(1)->fallthrough();
    addCommand<Options>(command, invocation, "list", "List every font of the registry", list,
                        [](CLI::App&, Options&) {});
    addFontChangeCommands(command, invocation);
}

}  // namespace typhon
