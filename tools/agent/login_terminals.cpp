#include "tools/agent/login_terminals.h"

#include "platform/linux/process_stat.h"

#include <algorithm>
#include <charconv>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <optional>
#include <string_view>
#include <system_error>

#include <fcntl.h>
#include <sys/stat.h>

namespace typhon {

namespace {

std::optional<pid_t> processNumber(const std::string& name)
{
    pid_t number = 0;
    const auto [end, error] = std::from_chars(name.data(), name.data() + name.size(), number);
    return error == std::errc() && end == name.data() + name.size() ? std::optional(number) : std::nullopt;
}

/// The terminal of the session that the process leads, or 0.
std::uint32_t terminalOfLeader(pid_t process, uid_t user)
{
    const auto directory = "/proc/" + std::to_string(process);
    struct stat status {};
    if (::stat(directory.c_str(), &status) != 0 || status.st_uid != user) {
        return 0;
    }
    std::ifstream file(directory + "/stat");
    const std::string text{std::istreambuf_iterator<char>(file), {}};
    const auto stat = processStatFrom(text);
    return stat && stat->session == process ? stat->terminal : 0;
}

}  // namespace

std::string terminalPath(std::uint32_t device)
{
    constexpr std::uint32_t consoles = 4;
    constexpr std::uint32_t pseudoTerminals = 136;
    constexpr std::uint32_t consoleCount = 64;
    const auto major = (device >> 8) & 0xFFF;
    const auto minor = (device & 0xFF) | ((device >> 12) & 0xFFF00);
    if (major == pseudoTerminals) {
        return "/dev/pts/" + std::to_string(minor);
    }
    if (major == consoles && minor > 0) {
        return minor < consoleCount ? "/dev/tty" + std::to_string(minor)
                                    : "/dev/ttyS" + std::to_string(minor - consoleCount);
    }
    return {};
}

std::map<std::uint32_t, std::string> loginTerminals(uid_t user)
{
    std::map<std::uint32_t, std::string> terminals;
    std::error_code error;
    for (std::filesystem::directory_iterator entry("/proc", error), end; !error && entry != end;
         entry.increment(error)) {
        const auto process = processNumber(entry->path().filename().string());
        const auto device = process ? terminalOfLeader(*process, user) : 0;
        auto path = terminalPath(device);
        if (!path.empty()) {
            terminals.emplace(device, std::move(path));
        }
    }
    return terminals;
}

FileDescriptor openTerminal(const std::string& path)
{
    return FileDescriptor(::open(path.c_str(), O_RDWR | O_NOCTTY | O_NONBLOCK | O_CLOEXEC));
}

}  // namespace typhon
