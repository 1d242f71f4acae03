#include "platform/linux/file_access_broker.h"

#include "platform/linux/bus_message.h"
#include "platform/linux/process_inspection.h"
#include "platform/linux/service_object.h"

#include <string>

namespace typhon {

namespace {

constexpr const char* fileNotFound = "org.freedesktop.DBus.Error.FileNotFound";
constexpr const char* expired = "com.vorlan.typhond.Error.Expired";

IpcError denied(const char* why)
{
    return {ipc_errors::accessDenied, why};
}

void answer(FileAccessBroker* broker, IncomingCall& call)
{
    const auto* token = std::get_if<PropertyList>(&call.arguments().at(0));
    const auto* path = std::get_if<PropertyList>(&call.arguments().at(1));
    if (broker == nullptr || token == nullptr || path == nullptr || token->asData() == nullptr ||
        path->asString() == nullptr) {
        call.fail({ipc_errors::invalidArguments, "open takes a token and a path"});
        return;
    }
    const auto& bytes = token->asData()->bytes;
    const std::string_view text(reinterpret_cast<const char*>(bytes.data()), bytes.size());
    auto opening = broker->open(currentAuditToken(), text, *path->asString());
    if (!opening.file) {
        call.fail(std::move(opening.error));
        return;
    }
    const std::shared_ptr<TransferredFile> file =
        std::make_shared<LinuxTransferredFile>(std::move(opening.file));
    call.reply({Argument(file)});
}

}  // namespace

std::optional<IpcError> FileAccessBroker::refusal(const AuditToken& bearer, std::string_view token,
                                                  std::string_view path)
{
    const auto* tree = fontTreeOf(path);
    if (!isPlainPath(path) || tree == nullptr) {
        return denied("that is not the path of a font file");
    }
    if (token.empty() && !tree->needsGrant) {
        const auto task = codeSigning_.taskFromAuditToken(bearer);
        return task && task->signingIdentifier ? std::nullopt
                                               : std::optional(denied("for identified programs only"));
    }
    switch (tokens_.check(token, bearer, path)) {
    case ExtensionTokens::Verdict::granted:
        return isSameProcess(bearer) ? std::nullopt : std::optional(denied("the process is another one now"));
    case ExtensionTokens::Verdict::expired:
        return IpcError{expired, "the token is of an earlier daemon: check in again"};
    case ExtensionTokens::Verdict::refused:
        break;
    }
    return denied("the token does not grant this process that file");
}

FileAccessBroker::Opening FileAccessBroker::open(const AuditToken& bearer, std::string_view token,
                                                 std::string_view path)
{
    if (token.ends_with('\0')) {
        token.remove_suffix(1);
    }
    if (auto error = refusal(bearer, token, path)) {
        return {{}, std::move(*error)};
    }
    auto opening = files_.open(std::string(path));
    switch (opening.failure) {
    case FontFiles::Failure::none:
        return {std::move(opening.file), {}};
    case FontFiles::Failure::missing:
        return {{}, {fileNotFound, "there is no such file"}};
    case FontFiles::Failure::refused:
        break;
    }
    return {{}, denied("that is not a plain file of the font trees")};
}

bool FileAccessBroker::listener(Listener&, std::shared_ptr<Connection> shouldAcceptNewConnection)
{
    accept(*shouldAcceptNewConnection, weak_from_this(), answer);
    return true;
}

InterfaceDescriptions FileAccessBroker::interfaces()
{
    static const auto descriptions = std::make_shared<const std::vector<InterfaceDescription>>(
        std::vector<InterfaceDescription>{{"com.vorlan.typhond.FileAccess", {{"open", "ays", "h", true}}}});
    return descriptions;
}

std::shared_ptr<Listener> startFileAccessService(Ipc& ipc, const std::shared_ptr<FileAccessBroker>& broker)
{
    return startService(ipc, broker);
}

}  // namespace typhon
