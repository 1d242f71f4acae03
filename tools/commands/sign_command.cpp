#include "platform/ipc.h"
#include "platform/linux/regular_file.h"
#include "platform/linux/signing.h"
#include "tools/commands/command.h"
#include "tools/property_list_file.h"

namespace typhon {

namespace {

struct Options {
    std::string key;
    std::string identifier;
    std::string entitlements;
    std::string executable;
};

ClientResult<PropertyList::Dictionary> entitlementsIn(const std::string& file)
{
    if (file.empty()) {
        return PropertyList::Dictionary{};
    }
    const auto read = readPropertyListFile(file);
    if (!read) {
        return read.error();
    }
    const auto* entitlements = read->asDictionary();
    if (entitlements == nullptr) {
        return ClientError{ipc_errors::invalidArguments, file + " holds no dictionary",
                           "Write a property list whose root is a dictionary: entitlement to value."};
    }
    return *entitlements;
}

ClientResult<Sha256> hashOf(const std::string& executable)
{
    const auto opened = openRegularFile(executable);
    const auto hash = opened.error == 0 ? sha256OfFile(opened.file.get()) : std::nullopt;
    if (!hash) {
        return ClientError{ipc_errors::failed, "cannot read " + executable + ": " + opened.errorText(),
                           "Name an executable file that you may read."};
    }
    return *hash;
}

int sign(const Invocation& invocation, const Options& options)
{
    const auto key = readSigningKeyFile(options.key);
    if (!key.value) {
        return fail(key.error, "Name the secret key that keygen made.");
    }
    const auto entitlements = entitlementsIn(options.entitlements);
    if (!entitlements) {
        return fail(entitlements.error());
    }
    const auto hash = hashOf(options.executable);
    if (!hash) {
        return fail(hash.error());
    }
    const auto written =
        writeSignature(invocation.root(), *key.value, {options.identifier, *entitlements, *hash});
    if (!written.value) {
        return fail(written.error, "Only an administrator may store signatures; use sudo, or --root for a "
                                   "scratch system of your own.");
    }
    return invocation.json ? printJson({{"signature", *written.value}})
                           : print("Signed " + options.executable + " as " + options.identifier + ": " +
                                   *written.value + "\n");
}

void declare(CLI::App& command, Options& options)
{
    command.add_option("--key", options.key, "The secret key")->required()->type_name("FILE");
    command.add_option("--identifier", options.identifier, "The signing identifier, as org.example.viewer")
        ->required()
        ->type_name("ID");
    command
        .add_option("--entitlements", options.entitlements,
                    "A property list with a dictionary of entitlements (default: none)")
        ->type_name("PLIST");
    command.add_option("executable", options.executable, "What to sign; sign again when it changed")
        ->required()
        ->type_name("EXECUTABLE");
}

}  // namespace

void addSignCommand(CLI::App& parser, Invocation& invocation)
{
    addCommand<Options>(parser, invocation, "sign", "Sign an executable for an identifier", sign, declare);
}

}  // namespace typhon
