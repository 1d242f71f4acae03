#pragma once

// Real processes for tests.

#include "platform/linux/audit_tokens.h"
#include "platform/linux/file_descriptor.h"
#include "platform/linux/pidfd.h"

#include <array>
#include <csignal>
#include <cstdlib>
#include <fstream>
#include <functional>
#include <stdexcept>
#include <string>
#include <vector>

#include <poll.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

namespace typhon::testing {

/// Waits until something can be read, for at most half a minute; false when nothing comes.
inline bool waitReadable(int descriptor)
{
    pollfd waiting{.fd = descriptor, .events = POLLIN, .revents = 0};
    return ::poll(&waiting, 1, 30'000) == 1;
}

/// A child process with a stream to and from it. Killed and reaped at the end.
class ChildProcess {
public:
    /// Forks; the child runs `body` with its end of the stream and never returns from it.
    explicit ChildProcess(const std::function<void(int)>& body)
    {
        int ends[2];
        if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) {
            throw std::runtime_error("no socket pair");
        }
        ours_ = FileDescriptor(ends[0]);
        FileDescriptor theirs(ends[1]);
        pid_ = ::fork();
        if (pid_ == 0) {
            ::prctl(PR_SET_PDEATHSIG, SIGKILL);
            ours_ = FileDescriptor();
            body(theirs.get());
            ::_exit(0);
        }
        pidfd_ = openPidfd(pid_);
    }

    /// Runs a program whose standard input and output are the stream.
    explicit ChildProcess(const std::vector<std::string>& command)
        : ChildProcess([&command](int stream) {
              ::dup2(stream, 0);
              ::dup2(stream, 1);
              exec(command);
          })
    {}

    ChildProcess(const ChildProcess&) = delete;
    ChildProcess& operator=(const ChildProcess&) = delete;
    ~ChildProcess() { end(); }

    static void exec(const std::vector<std::string>& command)
    {
        std::vector<char*> arguments;
        for (const auto& argument : command) {
            arguments.push_back(const_cast<char*>(argument.c_str()));
        }
        arguments.push_back(nullptr);
        ::execvp(arguments[0], arguments.data());
        ::_exit(127);
    }

    pid_t pid() const { return pid_; }
    int pidfd() const { return pidfd_.get(); }
    int stream() const { return ours_.get(); }

    /// The child's token, as it is now.
    AuditToken token() const { return tokenOfProcess(pidfd_.get()); }

    /// The token of the innermost descendant: of what runs inside a sandbox, once it has answered.
    AuditToken tokenInside() const
    {
        pid_t inside = pid_;
        for (pid_t next = inside; next > 0; next = firstChildOf(inside)) {
            inside = next;
        }
        const auto pidfd = openPidfd(inside);
        return tokenOfProcess(pidfd.get());
    }

    /// The first child of a process, or 0.
    static pid_t firstChildOf(pid_t parent)
    {
        const auto number = std::to_string(parent);
        pid_t child = 0;
        std::ifstream("/proc/" + number + "/task/" + number + "/children") >> child;
        return child;
    }

    void write(const std::string& text) const
    {
        if (::send(ours_.get(), text.data(), text.size(), MSG_NOSIGNAL) !=
            static_cast<ssize_t>(text.size())) {
            throw std::runtime_error("the child does not listen");
        }
    }

    /// What the child writes next, at most 4,096 bytes; empty when its end is closed.
    std::string read() const
    {
        std::array<char, 4096> buffer;
        if (!waitReadable(ours_.get())) {
            throw std::runtime_error("the child says nothing");
        }
        const auto length = ::recv(ours_.get(), buffer.data(), buffer.size(), 0);
        return {buffer.data(), static_cast<std::size_t>(length > 0 ? length : 0)};
    }

    /// Returns when a child that echoes (such as cat) surely runs.
    void waitForEcho() const
    {
        write("x");
        if (read() != "x") {
            throw std::runtime_error("the child does not echo");
        }
    }

    /// Kills and reaps it.
    void end()
    {
        if (pid_ > 0) {
            ::kill(pid_, SIGKILL);
            ::waitpid(pid_, nullptr, 0);
            pid_ = 0;
        }
    }

private:
    pid_t pid_ = 0;
    FileDescriptor ours_;
    FileDescriptor pidfd_;
};

/// Blocks until killed; what a forked child does that only has to be there.
inline void remain(int stream)
{
    const char ready = 'r';
    if (::write(stream, &ready, 1) == 1) {
        for (;;) {
            ::pause();
        }
    }
}

}  // namespace typhon::testing
