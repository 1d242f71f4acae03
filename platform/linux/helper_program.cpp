#include "platform/linux/helper_program.h"

#include <cstdio>
#include <string_view>

#include <sys/socket.h>
#include <unistd.h>

namespace typhon {

std::optional<int> exitUnlessStartedByUs(int count, char** arguments, const char* usage)
{
    int kind = 0;
    socklen_t size = sizeof kind;
    if (count == 1 && ::getsockopt(STDIN_FILENO, SOL_SOCKET, SO_TYPE, &kind, &size) == 0 &&
        kind == SOCK_SEQPACKET) {
        return std::nullopt;
    }
    const bool isHelp = count == 2 && std::string_view(arguments[1]) == "--help";
    std::fputs(usage, isHelp ? stdout : stderr);
    return isHelp ? 0 : 2;
}

}  // namespace typhon
