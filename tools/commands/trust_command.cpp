#include "platform/linux/signing.h"
#include "tools/commands/command.h"

#include <vector>

namespace typhon {

namespace {

struct Options {
    std::vector<std::string> identifiers;
    std::vector<std::string> entitlements;
    bool platform = false;
    std::string key;
};

std::optional<std::vector<std::string>> unlessEmpty(const std::vector<std::string>& names)
{
    return names.empty() ? std::nullopt : std::optional(names);
}

int trust(const Invocation& invocation, const Options& options)
{
    const auto key = readPublicKeyFile(options.key);
    if (!key.value) {
        return fail(key.error, "Name the public key that keygen made, FILE.pub.");
    }
    const KeyScope scope{options.platform, unlessEmpty(options.identifiers),
                         unlessEmpty(options.entitlements)};
    const auto written = writeTrustedKey(invocation.root(), {*key.value, scope});
    if (!written.value) {
        return fail(written.error, "Only an administrator may trust keys; use sudo, or --root for a scratch "
                                   "system of your own.");
    }
    return invocation.json ? printJson({{"trusted", *written.value}})
                           : print("Trusted: " + *written.value + "\n");
}

void declare(CLI::App& command, Options& options)
{
    command
        .add_option("--identifiers", options.identifiers,
                    "Identifiers the key may sign: those that begin with PREFIX (repeatable; default: all "
                    "outside com.vorlan.)")
        ->allow_extra_args(false)
        ->type_name("PREFIX");
    command
        .add_option("--entitlements", options.entitlements,
                    "An entitlement the key may grant (repeatable; default: all)")
        ->allow_extra_args(false)
        ->type_name("NAME");
    command.add_flag("--platform", options.platform,
                     "The key may sign identifiers within com.vorlan. as well");
    command.add_option("key", options.key, "The public key")->required()->type_name("FILE.pub");
}

}  // namespace

void addTrustCommand(CLI::App& parser, Invocation& invocation)
{
    addCommand<Options>(parser, invocation, "trust", "Trust what a key signs", trust, declare);
}

}  // namespace typhon
