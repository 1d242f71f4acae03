#include "platform/linux/process_inspection.h"

#include "platform/linux/exec_generation.h"
#include "platform/linux/pidfd.h"

#include <algorithm>
#include <mutex>
#include <utility>
#include <vector>

#include <fcntl.h>
#include <unistd.h>

namespace typhon {

namespace {

/// Enough for the status of a process with thousands of groups.
constexpr std::size_t statusLimit = 64 * 1024;

/// The file from its start, up to the end or to the limit; null when it cannot be read.
std::optional<std::string> textOf(int file, std::size_t limit)
{
    thread_local std::vector<char> buffer(statusLimit);
    std::string text;
    while (text.size() < limit) {
        const auto room = std::min(buffer.size(), limit - text.size());
        const auto count = ::pread(file, buffer.data(), room, static_cast<off_t>(text.size()));
        if (count < 0) {
            return std::nullopt;
        }
        text.append(buffer.data(), static_cast<std::size_t>(count));
        // A file of /proc that leaves half of the room is at its end.
        if (static_cast<std::size_t>(count) < room / 2) {
            break;
        }
    }
    return text;
}

}  // namespace

ProcessInspection::ProcessInspection(const AuditToken& token, std::shared_ptr<const HeldProcess> process)
    : token_(token), process_(std::move(process))
{}

std::optional<ProcessInspection> ProcessInspection::begin(const AuditToken& token)
{
    auto process = holdProcess(token);
    return process ? std::optional(ProcessInspection(token, std::move(process))) : std::nullopt;
}

SeenOfProcess& ProcessInspection::seen() const
{
    auto* shared = MessageLooks::of(token_);
    return shared == nullptr ? seen_ : *shared;
}

/// What is read of it from now on is not confirmed yet.
const HeldProcess& ProcessInspection::readNow() const
{
    seen().isConfirmed = false;
    return *process_;
}

int ProcessInspection::directory() const
{
    return readNow().directory.get();
}

int ProcessInspection::pidfd() const
{
    return readNow().pidfd.get();
}

bool ProcessInspection::isStillTheSame() const
{
    if (seen().isConfirmed) {
        return true;
    }
    // In this order: a process that still has its number at the end had it, and that directory, since the
    // pidfd was opened.
    const bool isSameProgram =
        execGeneration(token_.processIdentifier, process_->directory.get()) == token_.execGeneration;
    const auto process = isSameProgram ? processOfPidfd(process_->pidfd.get()) : std::nullopt;
    if (!process || process->processIdentifier != token_.processIdentifier) {
        seen() = {};
        return false;
    }
    seen().isConfirmed = true;
    // Only of senders it is likely that somebody asks about them again.
    if (MessageLooks::of(token_) != nullptr) {
        keepProcess(token_, process_);
    }
    return true;
}

std::optional<std::string> ProcessInspection::contents(const char* name, std::size_t limit) const
{
    const FileDescriptor file(::openat(directory(), name, O_RDONLY | O_CLOEXEC));
    return file ? textOf(file.get(), limit) : std::nullopt;
}

std::shared_ptr<const std::string> ProcessInspection::status() const
{
    auto& known = seen().status;
    if (!known) {
        if (auto text = textOf(readNow().status.get(), statusLimit)) {
            known = std::make_shared<const std::string>(*std::move(text));
        }
    }
    return known;
}

std::shared_ptr<const FileDescriptor> ProcessInspection::root() const
{
    auto& known = seen().root;
    if (!known) {
        known = std::make_shared<const FileDescriptor>(
            ::openat(directory(), "root", O_PATH | O_DIRECTORY | O_CLOEXEC));
    }
    return known;
}

bool isSameProcess(const AuditToken& token)
{
    const auto* seen = MessageLooks::of(token);
    if (seen != nullptr && seen->isConfirmed) {
        return true;
    }
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
