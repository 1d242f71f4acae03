#include "sdk/client_errors.h"

#include "platform/ipc.h"

#include <array>
#include <cerrno>
#include <string_view>
#include <system_error>
#include <utility>

namespace typhon {

namespace {

using Advice = std::pair<std::string_view, std::string_view>;

constexpr std::array advices{
    Advice{ipc_errors::accessDenied,
           "The program may not do this: check its signature, its entitlements, and that the font was "
           "granted to it."},
    Advice{ipc_errors::disconnected, "The daemon ended the connection: connect and check in again."},
    Advice{ipc_errors::limitsExceeded, "Close connections or files that are no longer needed and try again."},
    Advice{ipc_errors::notSupported, "This version of the daemon cannot do this: update it."},
    Advice{ipc_errors::unknownMethod, "The daemon does not know this operation: update it."},
    Advice{client_errors::expired, "The daemon was restarted since the last check-in: check in again."},
    Advice{client_errors::serviceUnknown,
           "Start typhond, or name the folder of a scratch system with --root or TYPHON_ROOT."},
    Advice{client_errors::inconsistentMessage,
           "The daemon and this program do not fit each other: update both."},
};

std::string nameForErrorNumber(int number)
{
    switch (number) {
    case EACCES:
    case EPERM:
        return ipc_errors::accessDenied;
    case ENOENT:
        return client_errors::fileNotFound;
    case ECONNRESET:
    case ENOTCONN:
    case EPIPE:
    case ESHUTDOWN:
        return ipc_errors::disconnected;
    case EMFILE:
    case ENFILE:
    case ENOBUFS:
        return ipc_errors::limitsExceeded;
    case ETIMEDOUT:
        return ipc_errors::timeout;
    case EINVAL:
        return ipc_errors::invalidArguments;
    default:
        return ipc_errors::failed;
    }
}

}  // namespace

ClientError clientError(std::string name, std::string message)
{
    for (const auto& [errorName, text] : advices) {
        if (name == errorName) {
            return {std::move(name), std::move(message), std::string(text)};
        }
    }
    return {std::move(name), std::move(message), {}};
}

ClientError systemError(int number, const std::string& what)
{
    auto error =
        clientError(nameForErrorNumber(number), what + ": " + std::generic_category().message(number));
    if (error.name == ipc_errors::accessDenied) {
        error.advice = "This user may not do that: check the permissions.";
    }
    return error;
}

}  // namespace typhon
