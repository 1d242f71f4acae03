#include "fontmanager/helper_launcher.h"

#include "fontmanager/font_registry_wire.h"
#include "fontmanager/helper_files.h"
#include "platform/linux/durable_file.h"
#include "platform/linux/regular_file.h"
#include "platform/linux/started_program.h"
#include "sdk/client_errors.h"

#include <array>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <vector>

#include <fcntl.h>
#include <poll.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

// On a machine with systemd the helper's socket is always there. In a scratch system, and where there is no
// service manager, the first unsandboxed program that needs the helper starts it. It must not be a child that
// somebody has to wait for, nor keep the files of whoever started it open, nor die with its terminal.

namespace typhon {

namespace {

constexpr auto patience = std::chrono::seconds(20);

ClientError notThere(const std::string& why)
{
    return {client_errors::serviceUnknown, "the helper of the font registry does not run" + why,
            "Start typhond, which brings it up, or typhon-fontmanagerd itself."};
}

/// In the child: no other thread runs here, so only what is safe after a fork is called. The helper keeps
/// `sign` open for as long as it lives.
[[noreturn]] void becomeHelper(const char* program, char* const* arguments, const char* log, int sign)
{
    constexpr int signOfLife = STDERR_FILENO + 1;
    // At once: whoever starts the helper may be killed, and its successor needs the name of its socket.
    if (::dup2(sign, signOfLife) == sign) {
        ::fcntl(sign, F_SETFD, 0);
    }
    ::close_range(signOfLife + 1, ~0U, 0);
    ::setsid();
    if (::fork() != 0) {
        ::_exit(0);
    }
    const int input = ::open("/dev/null", O_RDONLY);
    const int output = ::open(log, O_WRONLY | O_CREAT | O_APPEND | O_NOFOLLOW, 0600);
    ::dup2(input, STDIN_FILENO);
    ::dup2(output < 0 ? input : output, STDOUT_FILENO);
    ::dup2(output < 0 ? input : output, STDERR_FILENO);
    ::close_range(signOfLife + 1, ~0U, 0);
    // What the daemon may do beyond others is not for the helper.
    ::prctl(PR_CAP_AMBIENT, PR_CAP_AMBIENT_CLEAR_ALL, 0, 0, 0);
    sigset_t none;
    ::sigemptyset(&none);
    ::pthread_sigmask(SIG_SETMASK, &none, nullptr);
    ::execv(program, arguments);
    ::_exit(127);
}

/// Gives a pipe that ends when the helper does.
FileDescriptor startDetached(const std::string& program, const RootDirectory& root)
{
    std::vector<std::string> words{program};
    if (root.isScratch()) {
        words.insert(words.end(), {"--root", root.directory()});
    }
    std::vector<char*> arguments;
    arguments.reserve(words.size() + 1);
    for (auto& word : words) {
        arguments.push_back(word.data());
    }
    arguments.push_back(nullptr);
    const auto log = root.real(helper_files::log);
    std::array<int, 2> ends{-1, -1};
    if (::pipe2(ends.data(), O_CLOEXEC) != 0) {
        return {};
    }
    FileDescriptor life(ends[0]);
    const FileDescriptor sign(ends[1]);
    const pid_t child = ::fork();
    if (child == 0) {
        becomeHelper(program.c_str(), arguments.data(), log.c_str(), sign.get());
    }
    int status = 0;
    while (child > 0 && ::waitpid(child, &status, 0) < 0 && errno == EINTR) {
    }
    return life;
}

/// Waits a moment; true when the helper has ended meanwhile.
bool hasEnded(const FileDescriptor& life)
{
    constexpr int moment = 5;
    pollfd waited{.fd = life.get(), .events = POLLIN, .revents = 0};
    return ::poll(&waited, 1, moment) > 0;
}

ClientResult<ServiceConnection> connectOnce(const RootDirectory& root)
{
    return ServiceConnection::open(root, font_registry_wire::serviceName);
}

bool isNobodyThere(const ClientResult<ServiceConnection>& connection)
{
    return !connection && connection.error().name == client_errors::serviceUnknown;
}

ClientResult<ServiceConnection> startAndConnect(const RootDirectory& root, const std::string& program)
{
    const auto life = startDetached(program, root);
    const auto deadline = std::chrono::steady_clock::now() + patience;
    bool isAlive = static_cast<bool>(life);
    while (isAlive && std::chrono::steady_clock::now() < deadline) {
        auto connection = connectOnce(root);
        if (!isNobodyThere(connection)) {
            return connection;
        }
        isAlive = !hasEnded(life);
    }
    return notThere(" and did not come up; see " + root.real(helper_files::log));
}

}  // namespace

std::optional<std::string> helperProgram()
{
    return installedProgram(helper_files::program);
}

ClientResult<ServiceConnection> connectToHelper(const RootDirectory& root,
                                                const std::optional<std::string>& program)
{
    auto connection = connectOnce(root);
    if (!isNobodyThere(connection)) {
        return connection;
    }
    const auto found = program ? program : helperProgram();
    if (!found || ::access(found->c_str(), X_OK) != 0) {
        return notThere("");
    }
    if (makeDirectories(root.real(helper_files::runDirectory), 0755)) {
        return notThere(" and this program may not start it");
    }
    const FileLock starting(root.real(helper_files::startLock), patience);
    if (starting.error()) {
        return notThere(" and this program may not start it");
    }
    // Somebody else may have started it while this waited for the lock.
    connection = connectOnce(root);
    return isNobodyThere(connection) ? startAndConnect(root, *found) : std::move(connection);
}

}  // namespace typhon
