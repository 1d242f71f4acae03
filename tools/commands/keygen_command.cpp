#include "platform/linux/signing.h"
#include "tools/commands/command.h"

namespace typhon {

namespace {

struct Options {
    std::string key;
};

int keygen(const Invocation& invocation, const Options& options)
{
    const auto key = generateSigningKey();
    if (const auto error = writeKeyFiles(options.key, key)) {
        return fail(*error, "Choose a file that does not exist yet, in a folder you may write to.");
    }
    if (invocation.json) {
        return printJson({{"key", options.key}, {"public", options.key + ".pub"}});
    }
    return print("Secret key: " + options.key + " (keep it to yourself)\nPublic key: " + options.key +
                 ".pub (make it trusted with: typhonctl trust " + options.key + ".pub)\n");
}

}  // namespace

void addKeygenCommand(CLI::App& parser, Invocation& invocation)
{
    addCommand<Options>(parser, invocation, "keygen", "Make a pair of keys for signing executables", keygen,
                        [](CLI::App& command, Options& options) {
                            command
                                .add_option("--key", options.key,
                                            "Where the secret key goes; the public one goes to FILE.pub. "
                                            "Neither may exist")
                                ->required()
                                ->type_name("FILE");
                        });
}

}  // namespace typhon
