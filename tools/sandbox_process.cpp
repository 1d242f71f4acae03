#include "tools/sandbox_process.h"

#include "platform/ipc.h"
#include "sdk/client_errors.h"

#include <cerrno>
#include <csignal>
#include <fstream>
#include <sstream>
#include <string_view>

#include <fcntl.h>
#include <nlohmann/json.hpp>
#include <sys/mman.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/wait.h>

namespace typhon {

namespace {

using Words = std::vector<std::string>;

constexpr const char* notMade = "the sandbox could not be made";
constexpr int passedOn[] = {SIGHUP, SIGINT, SIGQUIT, SIGTERM, SIGUSR1, SIGUSR2};

// Where bubblewrap finds its files. Everything else that this process holds open stays outside.
constexpr int optionsAt = 3;
constexpr int informationAt = 4;
constexpr int releaseAt = 5;

struct Pipe {
    FileDescriptor reading;
    FileDescriptor writing;
};

/// Both ends lie above the places of bubblewrap's files, so that moving one there closes no other.
FileDescriptor movedUp(int descriptor)
{
    const FileDescriptor low(descriptor);
    return FileDescriptor(low ? ::fcntl(low.get(), F_DUPFD_CLOEXEC, releaseAt + 1) : -1);
}

Pipe makePipe()
{
    int ends[2] = {-1, -1};
    if (::pipe2(ends, O_CLOEXEC) < 0) {
        return {};
    }
    return {movedUp(ends[0]), movedUp(ends[1])};
}

/// A pipe that can be written to without a signal when the reader is gone.
Pipe makeReleasePipe()
{
    int ends[2] = {-1, -1};
    if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) < 0) {
        return {};
    }
    return {movedUp(ends[0]), movedUp(ends[1])};
}

/// The options as bubblewrap's --args reads them: each with a final zero byte.
FileDescriptor optionsFile(const Words& options)
{
    std::string bytes;
    for (const auto& option : options) {
        bytes += option;
        bytes += '\0';
    }
    auto file = movedUp(::memfd_create("typhon-sandbox", MFD_CLOEXEC));
    const auto size = static_cast<ssize_t>(bytes.size());
    if (!file || ::write(file.get(), bytes.data(), bytes.size()) != size ||
        ::lseek(file.get(), 0, SEEK_SET) != 0) {
        return {};
    }
    return file;
}

Words bubblewrapCommand(const Words& command)
{
    Words words{"bwrap",
                "--args",
                std::to_string(optionsAt),
                "--info-fd",
                std::to_string(informationAt),
                "--block-fd",
                std::to_string(releaseAt),
                "--"};
    words.insert(words.end(), command.begin(), command.end());
    return words;
}

/// In the child. Only what is safe after a fork.
[[noreturn]] void become(char** words, int options, int information, int release)
{
    const bool isPlaced = ::dup2(options, optionsAt) == optionsAt &&
                          ::dup2(information, informationAt) == informationAt &&
                          ::dup2(release, releaseAt) == releaseAt;
    if (isPlaced && ::close_range(releaseAt + 1, ~0U, 0) == 0) {
        ::execvp(words[0], words);
    }
    ::_exit(errno == ENOENT ? 127 : 126);
}

std::string readAll(int descriptor)
{
    std::string text;
    char block[4096];
    ssize_t count = 0;
    while ((count = ::read(descriptor, block, sizeof block)) > 0 || (count < 0 && errno == EINTR)) {
        text.append(block, count > 0 ? static_cast<std::size_t>(count) : 0);
    }
    return text;
}

/// The value of a field of /proc/PID/status, or empty.
std::string statusField(pid_t process, std::string_view name)
{
    std::ifstream status("/proc/" + std::to_string(process) + "/status");
    for (std::string line; std::getline(status, line);) {
        if (line.starts_with(name) && line.substr(name.size()).starts_with(":\t")) {
            return line.substr(name.size() + 2);
        }
    }
    return {};
}

bool isFirstProcessOf(pid_t process, pid_t bubblewrap)
{
    return statusField(process, "PPid") == std::to_string(bubblewrap) &&
           statusField(process, "NSpid").ends_with("\t1");
}

int shellStatus(int status)
{
    return WIFSIGNALED(status) ? 128 + WTERMSIG(status) : WEXITSTATUS(status);
}

/// The status of an ended child, or none while it runs.
std::optional<int> statusOf(pid_t child, int flags)
{
    int status = 0;
    pid_t outcome = 0;
    do {
        outcome = ::waitpid(child, &status, flags);
    } while (outcome < 0 && errno == EINTR);
    return outcome == child ? std::optional(shellStatus(status)) : std::nullopt;
}

ClientError startError(pid_t bubblewrap)
{
    if (statusOf(bubblewrap, 0) == 127) {
        return {client_errors::fileNotFound, "there is no bubblewrap (bwrap) on this machine",
                "Install the package bubblewrap."};
    }
    return {ipc_errors::failed, notMade, "See what bubblewrap said above."};
}

}  // namespace

ClientResult<SandboxProcess> SandboxProcess::start(const Words& options, const Words& command)
{
    const auto optionsDescriptor = optionsFile(options);
    auto information = makePipe();
    auto release = makeReleasePipe();
    if (!optionsDescriptor || !information.writing || !release.writing) {
        return systemError(errno, notMade);
    }
    auto words = bubblewrapCommand(command);
    std::vector<char*> pointers;
    for (auto& word : words) {
        pointers.push_back(word.data());
    }
    pointers.push_back(nullptr);
    const pid_t child = ::fork();
    if (child < 0) {
        return systemError(errno, notMade);
    }
    if (child == 0) {
        become(pointers.data(), optionsDescriptor.get(), information.writing.get(), release.reading.get());
    }
    information.writing = FileDescriptor();
    SandboxProcess sandbox(child, std::move(release.writing));
    const auto found = sandbox.findFirstProcess(information.reading.get());
    return found ? ClientResult<SandboxProcess>(std::move(sandbox)) : found.error();
}

SandboxProcess::SandboxProcess(SandboxProcess&& other) noexcept
    : bubblewrap_(std::exchange(other.bubblewrap_, -1)),
      firstProcessIdentifier_(other.firstProcessIdentifier_), firstProcess_(std::move(other.firstProcess_)),
      release_(std::move(other.release_))
{}

SandboxProcess::~SandboxProcess()
{
    if (bubblewrap_ < 0) {
        return;
    }
    // Bubblewrap ends with the first process and reaps it, so that nothing is left to anybody else.
    const bool isTold =
        firstProcess_ && ::syscall(SYS_pidfd_send_signal, firstProcess_.get(), SIGKILL, nullptr, 0) == 0;
    if (!isTold) {
        ::kill(bubblewrap_, SIGKILL);
    }
    statusOf(bubblewrap_, 0);
}

ClientResult<Done> SandboxProcess::findFirstProcess(int information)
{
    const auto told = nlohmann::json::parse(readAll(information), nullptr, false);
    if (!told.is_object() || !told.contains("child-pid") || !told["child-pid"].is_number_integer()) {
        const auto error = startError(bubblewrap_);
        bubblewrap_ = -1;
        return error;
    }
    firstProcessIdentifier_ = told["child-pid"].get<pid_t>();
    firstProcess_ = FileDescriptor(static_cast<int>(::syscall(SYS_pidfd_open, firstProcessIdentifier_, 0)));
    if (firstProcess_ && isFirstProcessOf(firstProcessIdentifier_, bubblewrap_)) {
        return Done{};
    }
    return clientError(ipc_errors::failed, std::string(notMade) + ": its first process is gone");
}

int SandboxProcess::releaseAndWait()
{
    sigset_t awaited;
    sigset_t before;
    sigemptyset(&awaited);
    sigaddset(&awaited, SIGCHLD);
    for (const int signal : passedOn) {
        sigaddset(&awaited, signal);
    }
    ::pthread_sigmask(SIG_BLOCK, &awaited, &before);
    const char go = 1;
    [[maybe_unused]] const auto written = ::send(release_.get(), &go, 1, MSG_NOSIGNAL);
    release_ = FileDescriptor();
    auto status = statusOf(bubblewrap_, WNOHANG);
    while (!status) {
        int signal = 0;
        ::sigwait(&awaited, &signal);
        if (signal != SIGCHLD) {
            passOn(signal);
        }
        status = statusOf(bubblewrap_, WNOHANG);
    }
    bubblewrap_ = -1;
    ::pthread_sigmask(SIG_SETMASK, &before, nullptr);
    return *status;
}

/// To the program itself: it is the first child of the sandbox's first process, which as such is deaf to
/// signals.
void SandboxProcess::passOn(int signal) const
{
    const auto process = std::to_string(firstProcessIdentifier_);
    std::ifstream children("/proc/" + process + "/task/" + process + "/children");
    pid_t program = -1;
    if (children >> program && program > 0) {
        ::kill(program, signal);
    }
}

}  // namespace typhon
