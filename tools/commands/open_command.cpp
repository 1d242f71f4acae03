#include "sdk/client_errors.h"
#include "sdk/typhon_client.h"
#include "tools/commands/command.h"

#include <cerrno>

#include <unistd.h>

namespace typhon {

namespace {

struct Options {
    std::string path;
};

/// 0, or the errno of what could not be written.
int writeAll(const char* bytes, std::size_t count)
{
    while (count > 0) {
        const auto written = ::write(STDOUT_FILENO, bytes, count);
        if (written < 0 && errno != EINTR) {
            return errno;
        }
        bytes += written > 0 ? written : 0;
        count -= written > 0 ? static_cast<std::size_t>(written) : 0;
    }
    return 0;
}

int copyToOutput(const FileDescriptor& file)
{
    char block[65536];
    for (;;) {
        const auto count = ::read(file.get(), block, sizeof block);
        if (count == 0) {
            return exitSuccess;
        }
        if (count < 0 && errno != EINTR) {
            return fail(systemError(errno, "cannot read the file"));
        }
        const int error = count < 0 ? 0 : writeAll(block, static_cast<std::size_t>(count));
        if (error != 0) {
            return fail(systemError(error, "cannot write to standard output"));
        }
    }
}

int open(const Invocation& invocation, const Options& options)
{
    auto client = TyphonClient::connect({invocation.rootOption});
    if (!client) {
        return fail(client.error());
    }
    const auto view = client->checkin();
    if (!view) {
        return fail(view.error());
    }
    const auto file = client->openFont(options.path);
    return file ? copyToOutput(*file) : fail(file.error());
}

}  // namespace

void addOpenCommand(CLI::App& parser, Invocation& invocation)
{
    addCommand<Options>(parser, invocation, "open",
                        "Check in, redeem the grant for a font file and write the file to standard output",
                        open, [](CLI::App& command, Options& options) {
                            command.add_option("path", options.path, "The file's path as checkin lists it")
                                ->required()
                                ->type_name("PATH");
                        });
}

}  // namespace typhon
