#include "tools/sandbox_launcher.h"

#include "platform/linux/bus_message.h"
#include "platform/linux/signing.h"
#include "sdk/client_errors.h"
#include "sdk/service_connection.h"
#include "tools/host_files.h"
#include "tools/sandbox_arguments.h"
#include "tools/sandbox_process.h"

#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <iostream>
#include <memory>
#include <sstream>

#include <fcntl.h>
#include <sys/stat.h>

namespace typhon {

namespace {

constexpr const char* sandboxService = "com.vorlan.typhond.sandboxes";
constexpr wire::Operation registerOperation{"com.vorlan.typhond.Sandboxes", "register", "hh", ""};

/// An executable with a "/" is a path; any other is looked up as a shell does.
std::string foundExecutable(const std::string& executable)
{
    if (executable.find('/') != std::string::npos) {
        return executable;
    }
    const char* searched = std::getenv("PATH");
    std::istringstream folders(searched == nullptr ? "/usr/bin:/bin" : searched);
    for (std::string folder; std::getline(folders, folder, ':');) {
        auto candidate = (folder.empty() ? "." : folder) + "/" + executable;
        struct stat status {};
        if (::stat(candidate.c_str(), &status) == 0 && S_ISREG(status.st_mode) &&
            ::access(candidate.c_str(), X_OK) == 0) {
            return candidate;
        }
    }
    return executable;
}

ClientResult<FileDescriptor> openExecutable(const std::string& path)
{
    FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOCTTY | O_NONBLOCK));
    if (!file) {
        auto error = systemError(errno, "cannot open " + path);
        error.advice = "Name an executable file; a name without \"/\" is looked up in PATH.";
        return error;
    }
    struct stat status {};
    if (::fstat(file.get(), &status) < 0 || !S_ISREG(status.st_mode)) {
        return ClientError{ipc_errors::invalidArguments, path + " is not a file", "Name an executable file."};
    }
    if (::access(path.c_str(), X_OK) < 0) {
        return systemError(errno, "cannot execute " + path);
    }
    return file;
}

FileDescriptor duplicate(const FileDescriptor& file)
{
    return FileDescriptor(::fcntl(file.get(), F_DUPFD_CLOEXEC, 3));
}

Argument transferred(const FileDescriptor& file)
{
    return std::shared_ptr<TransferredFile>(std::make_shared<LinuxTransferredFile>(duplicate(file)));
}

void noteMissingSignature(const RootDirectory& root, const std::string& path, const FileDescriptor& file)
{
    const auto hash = sha256OfFile(file.get());
    const auto signature = root.real(signaturesDirectory) + "/" + (hash ? hexOf(*hash) : "") + ".plist";
    struct stat status {};
    if (::stat(signature.c_str(), &status) < 0 && errno == ENOENT) {
        std::cerr << "typhonctl: " << path << " has no signature here: it runs without an identity and gets "
                  << "no fonts.\n  Sign it: typhonctl sign --key FILE --identifier ID " << path << "\n";
    }
}

ClientResult<Done> registerSandbox(ServiceConnection& service, const SandboxProcess& sandbox,
                                   const FileDescriptor& executable)
{
    const auto outcome =
        service.call(registerOperation, {transferred(sandbox.firstProcess()), transferred(executable)});
    if (!outcome) {
        auto error = outcome.error();
        error.message = "typhond did not take the sandbox: " + error.message;
        if (error.name == ipc_errors::accessDenied) {
            error.advice = "Only a program outside of any sandbox may start one; see typhond's log.";
        }
        return error;
    }
    return Done{};
}

/// What is asked for, in absolute paths.
ClientResult<SandboxRequest> requestFor(const RootDirectory& root, const std::string& executable,
                                        const std::vector<std::pair<std::string, std::string>>& binds)
{
    const LinuxHostFiles host;
    const auto found = foundExecutable(executable);
    SandboxRequest request{host.resolved(found),
                           std::filesystem::absolute(found).lexically_normal().string(),
                           {},
                           root.isScratch() ? host.resolved(root.directory()) : std::string()};
    for (const auto& [source, destination] : binds) {
        if (!destination.starts_with('/')) {
            return ClientError{ipc_errors::invalidArguments,
                               "the destination " + destination + " of a bind is not an absolute path",
                               "Begin it with a \"/\"."};
        }
        request.binds.emplace_back(host.resolved(source),
                                   std::filesystem::path(destination).lexically_normal().string());
    }
    return request;
}

std::vector<std::string> commandOf(const SandboxRequest& request, const std::vector<std::string>& arguments)
{
    std::vector<std::string> command{request.command};
    command.insert(command.end(), arguments.begin(), arguments.end());
    return command;
}

}  // namespace

ClientResult<int> runInSandbox(const RootDirectory& root, const std::string& executable,
                               const std::vector<std::string>& arguments,
                               const std::vector<std::pair<std::string, std::string>>& binds)
{
    const auto request = requestFor(root, executable, binds);
    if (!request) {
        return request.error();
    }
    const auto file = openExecutable(request->executable);
    if (!file) {
        return file.error();
    }
    const auto options = sandboxArguments(*request, LinuxHostFiles());
    if (!options) {
        return options.error();
    }
    auto service = ServiceConnection::open(root, sandboxService);
    if (!service) {
        return service.error();
    }
    auto sandbox = SandboxProcess::start(*options, commandOf(*request, arguments));
    if (!sandbox) {
        return sandbox.error();
    }
    const auto registered = registerSandbox(*service, *sandbox, *file);
    if (!registered) {
        return registered.error();
    }
    noteMissingSignature(root, request->executable, *file);
    return sandbox->releaseAndWait();
}

}  // namespace typhon
