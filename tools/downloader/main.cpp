#include "platform/linux/helper_program.h"
#include "tools/downloader/download.h"

#include <unistd.h>

int main(int count, char** arguments)
{
    constexpr const char* usage =
        "typhon-asset-downloader fetches one catalogue of assets, confined, and hands it over unread.\n"
        "It is started by the font access daemon or for it, with a socket to the daemon as standard\n"
        "input, and serves nobody else.\n";
    if (const auto status = typhon::exitUnlessStartedByUs(count, arguments, usage)) {
        return *status;
    }
    typhon::serveDownload(STDIN_FILENO);
    // Nothing is left to tidy up, and a library that was taken over gets no last word.
    ::_exit(0);
}
