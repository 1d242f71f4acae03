#include "fontmanager/font_names.h"
#include "fontmanager/font_zygote_process.h"

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
            "typhon-font-parser reads the names in font files, each in a confined process of its own.\n"
            "It is started by the programs that install fonts, with a socket to them as standard input,\n"
            "and serves nobody else.\n",
            isHelp ? stdout : stderr);
        return isHelp ? 0 : 2;
    }
    return typhon::runFontZygote(typhon::readFontNamesOfSize);
}
