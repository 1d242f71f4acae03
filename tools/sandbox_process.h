#pragma once

#include "platform/linux/file_descriptor.h"
#include "sdk/client_result.h"

#include <string>
#include <vector>

#include <sys/types.h>

namespace typhon {

/// A bubblewrap sandbox that is set up but whose program has not started: it waits for `release`. It dies
/// with this process, and when the object is destroyed before it was released. One thread.
class SandboxProcess {
public:
    /// Starts bubblewrap with these options and this program, and finds the sandbox's first process.
    static ClientResult<SandboxProcess> start(const std::vector<std::string>& options,
                                              const std::vector<std::string>& command);

    SandboxProcess(SandboxProcess&& other) noexcept;
    SandboxProcess& operator=(SandboxProcess&&) = delete;
    ~SandboxProcess();

    /// A pidfd of the sandbox's first process.
    const FileDescriptor& firstProcess() const { return firstProcess_; }

    /// Lets the program run and waits for its end, passing on the signals that ask a program to end, and a
    /// few more. Gives its exit status as a shell does: 128 and the signal's number for one that was killed.
    int releaseAndWait();

private:
    explicit SandboxProcess(pid_t bubblewrap, FileDescriptor release)
        : bubblewrap_(bubblewrap), release_(std::move(release))
    {}
    ClientResult<Done> findFirstProcess(int information);
    void passOn(int signal) const;

    pid_t bubblewrap_ = -1;
    pid_t firstProcessIdentifier_ = -1;
    FileDescriptor firstProcess_;
    /// Written to when the program may start.
    FileDescriptor release_;
};

}  // namespace typhon
