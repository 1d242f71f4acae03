#pragma once

#include "sdk/client_result.h"

#include <string>

namespace typhon {

/// The error names that the services use beside those of ipc.h.
namespace client_errors {
/// A token was issued by an earlier run of the daemon.
inline constexpr const char* expired = "com.vorlan.typhond.Error.Expired";
/// No service answers at the socket.
inline constexpr const char* serviceUnknown = "org.freedesktop.DBus.Error.ServiceUnknown";
/// The answer was not of the kind that the operation gives.
inline constexpr const char* inconsistentMessage = "org.freedesktop.DBus.Error.InconsistentMessage";
inline constexpr const char* fileNotFound = "org.freedesktop.DBus.Error.FileNotFound";
}  // namespace client_errors

/// An error with the advice that its name calls for.
ClientError clientError(std::string name, std::string message);

/// The error for a failed system call, named as D-Bus names it. `number` is a positive errno.
ClientError systemError(int number, const std::string& what);

}  // namespace typhon
