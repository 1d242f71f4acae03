#include "platform/linux/service_user.h"

#include <array>

#include <pwd.h>
#include <unistd.h>

namespace typhon {

bool runsAsServiceUser()
{
    std::array<char, 4096> buffer;
    passwd entry{};
    passwd* found = nullptr;
    return ::getpwnam_r("typhon", &entry, buffer.data(), buffer.size(), &found) == 0 && found != nullptr &&
           found->pw_uid == ::geteuid();
}

}  // namespace typhon
