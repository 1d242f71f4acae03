#include "platform/linux/process_inspection.h"

#include "platform/linux/exec_generation.h"
#include "platform/linux/pidfd.h"

#include <mutex>

#include <fcntl.h>

namespace typhon {

ProcessInspection::ProcessInspection(const AuditToken& token, FileDescriptor pidfd, FileDescriptor directory)
    : token_(token), pidfd_(std::move(pidfd)), directory_(std::move(directory))
{}

std::optional<ProcessInspection> ProcessInspection::begin(const AuditToken& token)
{
    if (token.processIdentifier <= 0 || token.processInstance == 0 || token.execGeneration == 0 ||
        token.bootEpoch != bootEpoch()) {
        return std::nullopt;
    }
    auto pidfd = openPidfd(token.processIdentifier);
    if (!pidfd || (kernelHasProcessInodes() && inodeOfPidfd(pidfd.get()) != token.processInstance)) {
        return std::nullopt;
    }
    const auto path = "/proc/" + std::to_string(token.processIdentifier);
    FileDescriptor directory(::open(path.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    if (!directory || (!kernelHasProcessInodes() && startTime(directory.get()) != token.processInstance)) {
        return std::nullopt;
    }
    return ProcessInspection(token, std::move(pidfd), std::move(directory));
}

bool ProcessInspection::isStillTheSame() const
{
    // In this order: a process that still has its number at the end had it, and that directory, since the
    // pidfd was opened.
    if (execGeneration(directory_.get()) != token_.execGeneration) {
        return false;
    }
    const auto process = processOfPidfd(pidfd_.get());
    return process && process->processIdentifier == token_.processIdentifier;
}

std::optional<std::string> ProcessInspection::contents(const char* name, std::size_t limit) const
{
    const FileDescriptor file(::openat(directory_.get(), name, O_RDONLY | O_CLOEXEC));
    if (!file) {
        return std::nullopt;
    }
    std::string text;
    while (text.size() < limit) {
        const auto before = text.size();
        text.resize(limit);
        const auto count = ::read(file.get(), text.data() + before, limit - before);
        text.resize(before + static_cast<std::size_t>(count > 0 ? count : 0));
        if (count < 0) {
            return std::nullopt;
        }
        if (count == 0) {
            break;
        }
    }
    return text;
}

bool isSameProcess(const AuditToken& token)
{
    const auto process = ProcessInspection::begin(token);
    return process && process->isStillTheSame();
}

void logProcessIdentity(Log& log)
{
    static std::once_flag once;
    std::call_once(once, [&log] {
        TYLog(log, kernelHasProcessInodes() ? "processes are told apart by their pidfd inode"
                                            : "processes are told apart by their start time only: this "
                                              "kernel has no pidfd inodes (Linux 6.9 "
                                              "has them)");
    });
}

}  // namespace typhon
