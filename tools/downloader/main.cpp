#include "tools/downloader/download.h"

#include <cstdio>
#include <string_view>

#include <sys/socket.h>
#include <unistd.h>

int main(int count, char** arguments)
{
    int kind = 0;
    socklen_t size = sizeof kind;
    const bool isStartedByUs = count == 1 &&
                               ::getsockopt(STDIN_FILENO, SOL_SOCKET, SO_TYPE, &kind, &size) == 0 &&
                               kind == SOCK_SEQPACKET;
    if (!isStartedByUs) {
        const bool isHelp = count == 2 && std::string_view(arguments[1]) == "--help";
        std::fputs(
            "typhon-asset-downloader fetches one catalogue of assets, confined, and hands it over unread.\n"
            "It is started by the font access daemon or for it, with a socket to the daemon as standard\n"
            "input, and serves nobody else.\n",
            isHelp ? stdout : stderr);
        return isHelp ? 0 : 2;
    }
    typhon::serveDownload(STDIN_FILENO);
    // Nothing is left to tidy up, and a library that was taken over gets no last word.
    ::_exit(0);
}
