#pragma once

#include <functional>

#include <sys/types.h>
#include <unistd.h>

namespace typhon {

/// Whether another process is believed because of the user it runs as.
using TrustsUser = std::function<bool(uid_t user)>;

/// Believes root, and processes of this process's own user: the other services of typhon.
inline bool isRootOrOwnUser(uid_t user)
{
    return user == 0 || user == ::geteuid();
}

}  // namespace typhon
