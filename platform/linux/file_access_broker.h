#pragma once

#include "platform/code_signing.h"
#include "platform/ipc.h"
#include "platform/linux/extension_tokens.h"
#include "platform/linux/file_descriptor.h"
#include "platform/linux/font_files.h"
#include "platform/linux/root_directory.h"
#include "platform/log.h"

#include <memory>
#include <string_view>

namespace typhon {

/// Redeems extension tokens for open files, at the service "com.vorlan.typhond.file-access". Any thread.
class FileAccessBroker : public ListenerDelegate, public std::enable_shared_from_this<FileAccessBroker> {
public:
    static constexpr const char* serviceName = "com.vorlan.typhond.file-access";

    struct Opening {
        FileDescriptor file;
        /// Set exactly when there is no file.
        IpcError error;
    };

    /// All of them outlive this.
    FileAccessBroker(CodeSigning& codeSigning, const ExtensionTokens& tokens, const RootDirectory& root,
                     Log& log)
        : codeSigning_(codeSigning), tokens_(tokens), files_(root, log)
    {}

    /// What the service's "open" does for a process. `token` may end in its zero byte; an empty one suffices
    /// for the files that every identified process may read.
    Opening open(const AuditToken& bearer, std::string_view token, std::string_view path);

    bool listener(Listener& listener, std::shared_ptr<Connection> shouldAcceptNewConnection) override;

    /// What the service exports.
    static InterfaceDescriptions interfaces();

    /// For tests of the way without private mounts.
    FontFiles& files() { return files_; }

private:
    /// Null when the process may read the file.
    std::optional<IpcError> refusal(const AuditToken& bearer, std::string_view token, std::string_view path);

    CodeSigning& codeSigning_;
    const ExtensionTokens& tokens_;
    FontFiles files_;
};

/// Opens the service: a resumed listener that asks `broker`, which stays alive as long as somebody holds it.
std::shared_ptr<Listener> startFileAccessService(Ipc& ipc, const std::shared_ptr<FileAccessBroker>& broker);

}  // namespace typhon
