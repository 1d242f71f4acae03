#include "platform/linux/linux_sandbox.h"

// Whether a process may read a path is asked of the kernel itself: the path is looked up in the root
// directory that the process has, under its credentials, and it must lead to the very file that the daemon
// has there. A Landlock domain is not seen by this.

namespace typhon {

bool LinuxSandbox::isSandboxed(const AuditToken& token)
{
    return inspectProcess(token, [this](const ProcessInspection& process) {
               return std::optional(probe_.look(process).isSandboxed);
           }) != false;
}

std::optional<bool> LinuxSandbox::reaches(const ProcessInspection& process, const std::string& path)
{
    const auto ours = inodeAt(AT_FDCWD, root_.real(path).c_str());
    const auto root = probe_.rootOf(process);
    const auto credentials = fileCredentialsOf(process, probe_.look(process).hasOwnUserNamespace);
    if (!ours || !*root || !credentials) {
        return std::nullopt;
    }
    bool isReached = false;
    const bool wasAsked = credentials_.ask(*credentials, [&] {
        isReached = (root_.isScratch() && readableFile(root->get(), root_.real(path)) == ours) ||
                    readableFile(root->get(), path) == ours;
    });
    return wasAsked ? std::optional(isReached) : std::nullopt;
}

bool LinuxSandbox::mayRead(const AuditToken& token, const std::string& path)
{
    if (path.empty() || path.front() != '/' || path.find('\0') != std::string::npos) {
        return false;
    }
    return inspectProcess(token, [&](const ProcessInspection& process) { return reaches(process, path); }) ==
           true;
}

std::optional<std::string> LinuxSandbox::issueReadExtension(const AuditToken& token, const std::string& path)
{
    return isSameProcess(token) ? tokens_.issue(token, path) : std::nullopt;
}

}  // namespace typhon
