#include "platform/linux/file_credentials.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <string>
#include <string_view>

#include <fcntl.h>
#include <linux/capability.h>
#include <sys/prctl.h>
#include <sys/syscall.h>
#include <unistd.h>

// The C library applies a change of credentials to all threads of a process; the raw system calls used here
// change the calling thread only. Each such change makes the whole process undumpable, which is put back.

namespace typhon {

namespace {

/// Looks for lines in the order in which the kernel writes them, so that it walks over the text once.
class StatusLines {
public:
    explicit StatusLines(std::string_view status) : status_(status) {}

    /// The value of a line; null when it does not follow on the last one that was asked for.
    std::optional<std::string_view> next(std::string_view name)
    {
        const auto start = status_.find(name);
        if (start == std::string_view::npos) {
            return std::nullopt;
        }
        status_.remove_prefix(start + name.size());
        return status_.substr(0, status_.find('\n'));
    }

private:
    std::string_view status_;
};

std::vector<std::uint64_t> numbersOf(std::string_view line, int base = 10)
{
    std::vector<std::uint64_t> numbers;
    const char* at = line.data();
    const char* const end = line.data() + line.size();
    while (at < end) {
        std::uint64_t number = 0;
        const auto [next, error] = std::from_chars(at, end, number, base);
        if (error == std::errc{}) {
            numbers.push_back(number);
        }
        at = next + 1;
    }
    return numbers;
}

std::optional<FileCredentials> parse(std::string_view status)
{
    StatusLines lines(status);
    const auto users = numbersOf(lines.next("\nUid:\t").value_or(""));
    const auto groupIds = numbersOf(lines.next("\nGid:\t").value_or(""));
    const auto groups = lines.next("\nGroups:\t");
    const auto capabilities = numbersOf(lines.next("\nCapEff:\t").value_or(""), 16);
    if (users.size() != 4 || groupIds.size() != 4 || capabilities.size() != 1 || !groups) {
        return std::nullopt;
    }
    FileCredentials credentials{
        static_cast<uid_t>(users[3]), static_cast<gid_t>(groupIds[3]), {}, capabilities[0] & readOverrides};
    for (const auto group : numbersOf(*groups)) {
        credentials.groups.push_back(static_cast<gid_t>(group));
    }
    std::ranges::sort(credentials.groups);
    return credentials;
}

/// What the daemon itself does not hold it cannot lend: the answer is then that of the plain permissions.
bool setReadOverrides(std::uint64_t overrides)
{
    __user_cap_header_struct header{_LINUX_CAPABILITY_VERSION_3, 0};
    std::array<__user_cap_data_struct, 2> sets{};
    if (::syscall(SYS_capget, &header, sets.data()) != 0) {
        return false;
    }
    const auto wanted = static_cast<std::uint32_t>(overrides) & sets[0].permitted;
    sets[0].effective = (sets[0].effective & ~static_cast<std::uint32_t>(readOverrides)) | wanted;
    return ::syscall(SYS_capset, &header, sets.data()) == 0;
}

/// `setfsuid` and `setfsgid` report nothing but the value before, so ask again with one that never is valid.
bool setFileSystemId(long call, unsigned id)
{
    ::syscall(call, id);
    return static_cast<unsigned>(::syscall(call, -1)) == id;
}

}  // namespace

std::optional<FileCredentials> fileCredentialsOf(const ProcessInspection& process, bool hasOwnUserNamespace)
{
    const auto status = process.status();
    auto credentials = status ? parse(*status) : std::nullopt;
    if (credentials && hasOwnUserNamespace) {
        credentials->overrides = 0;
    }
    return credentials;
}

FileCredentials ownFileCredentials()
{
    FileCredentials own;
    own.user = static_cast<uid_t>(::syscall(SYS_setfsuid, -1));
    own.group = static_cast<gid_t>(::syscall(SYS_setfsgid, -1));
    own.groups.resize(static_cast<std::size_t>(std::max(::getgroups(0, nullptr), 0)));
    own.groups.resize(static_cast<std::size_t>(
        std::max(::getgroups(static_cast<int>(own.groups.size()), own.groups.data()), 0)));
    std::ranges::sort(own.groups);
    __user_cap_header_struct header{_LINUX_CAPABILITY_VERSION_3, 0};
    std::array<__user_cap_data_struct, 2> sets{};
    ::syscall(SYS_capget, &header, sets.data());
    own.overrides = sets[0].effective & readOverrides;
    return own;
}

bool assumeFileCredentials(const FileCredentials& credentials)
{
    const int wasDumpable = ::prctl(PR_GET_DUMPABLE);
    const bool isDone = ::syscall(SYS_setgroups, credentials.groups.size(), credentials.groups.data()) == 0 &&
                        setFileSystemId(SYS_setfsgid, credentials.group) &&
                        setFileSystemId(SYS_setfsuid, credentials.user) &&
                        setReadOverrides(credentials.overrides);
    if (wasDumpable == 1) {
        ::prctl(PR_SET_DUMPABLE, 1);
    }
    return isDone;
}

}  // namespace typhon
