#include "platform/linux/downloader_process.h"

#include "platform/linux/regular_file.h"
#include "platform/linux/started_program.h"
#include "platform/linux/visible_text.h"

#include <array>
#include <cerrno>
#include <csignal>

#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>

namespace typhon {

namespace {

constexpr const char* programName = "typhon-asset-downloader";
constexpr int socketKind = SOCK_SEQPACKET | SOCK_CLOEXEC;

}  // namespace

DownloaderProcess::DownloaderProcess(const RootDirectory& root, const std::string& program)
{
    if (!program.empty() || !connectToService(root)) {
        startChild(program);
    }
}

DownloaderProcess::~DownloaderProcess()
{
    if (child_ > 0) {
        // It ends at once: what it does with files and sockets can be interrupted.
        ::kill(child_, SIGKILL);
        while (::waitpid(child_, nullptr, 0) < 0 && errno == EINTR) {
        }
    }
}

/// False where no service manager keeps the socket.
bool DownloaderProcess::connectToService(const RootDirectory& root)
{
    const auto path = root.real(std::string("/run/typhon/") + downloaderService);
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (path.size() >= sizeof address.sun_path) {
        return false;
    }
    path.copy(address.sun_path, path.size());
    FileDescriptor socket(::socket(AF_UNIX, socketKind | SOCK_NONBLOCK, 0));
    if (!socket ||
        ::connect(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
        return false;
    }
    socket_ = std::move(socket);
    return true;
}

void DownloaderProcess::startChild(std::string program)
{
    if (program.empty()) {
        program = installedProgram(programName).value_or(programName);
    }
    std::array<int, 2> pair{};
    if (::socketpair(AF_UNIX, socketKind, 0, pair.data()) != 0) {
        problem_ = "cannot make a socket for the downloader: " + errorText(errno);
        return;
    }
    socket_ = FileDescriptor(pair[0]);
    const FileDescriptor theirs(pair[1]);
    child_ = startProgram(program, theirs.get());
    if (child_ < 0) {
        problem_ = "cannot start the downloader " + visibleText(program) + ": " + errorText(-child_);
    }
}

}  // namespace typhon
