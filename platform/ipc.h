#pragma once

#include "platform/audit_token.h"
#include "platform/property_list.h"
#include "platform/task.h"
#include "platform/work_item.h"

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

namespace typhon {

/// Why a call failed: a D-Bus error name and a text for people.
struct IpcError {
    std::string name;
    std::string message;
};

/// The error names that the system itself uses.
namespace ipc_errors {
inline constexpr const char* accessDenied = "org.freedesktop.DBus.Error.AccessDenied";
inline constexpr const char* disconnected = "org.freedesktop.DBus.Error.Disconnected";
inline constexpr const char* failed = "org.freedesktop.DBus.Error.Failed";
inline constexpr const char* invalidArguments = "org.freedesktop.DBus.Error.InvalidArgs";
inline constexpr const char* limitsExceeded = "org.freedesktop.DBus.Error.LimitsExceeded";
inline constexpr const char* notSupported = "org.freedesktop.DBus.Error.NotSupported";
inline constexpr const char* timeout = "org.freedesktop.DBus.Error.Timeout";
inline constexpr const char* unknownMethod = "org.freedesktop.DBus.Error.UnknownMethod";
}  // namespace ipc_errors

/// An open file that travels in a message (an `h` on the wire), owned by whoever holds this. What it holds is
/// the transport's own matter; the core never looks inside.
class TransferredFile {
public:
    virtual ~TransferredFile() = default;
};

/// A transferable handle of an anonymous listener: whoever holds it can connect. On the wire it is a file
/// like any other, so a received one may turn out to be none; connecting to it then fails.
using ListenerEndpoint = TransferredFile;

using Argument = std::variant<PropertyList, std::shared_ptr<TransferredFile>>;
using Arguments = std::vector<Argument>;

/// One operation on the wire. Types are D-Bus signatures; values that may be null are arrays of none or one.
struct MemberDescription {
    std::string name;
    std::string inTypes;
    std::string outTypes;
    /// False for members that never answer; their calls count against no limit on unanswered calls.
    bool replies = true;
};

/// One interface, with its full name ("com.vorlan.typhond.TyphonProtocol").
struct InterfaceDescription {
    std::string name;
    std::vector<MemberDescription> members;
};
using InterfaceDescriptions = std::shared_ptr<const std::vector<InterfaceDescription>>;

/// A call that arrived and whose argument types match its description. Held as long as somebody may still
/// answer it; when the last holder lets go unanswered, the caller never hears. Any thread.
class IncomingCall {
public:
    virtual ~IncomingCall() = default;
    virtual const std::string& interface() const = 0;
    virtual const std::string& member() const = 0;
    virtual const Arguments& arguments() const = 0;
    virtual bool isReplyExpected() const = 0;
    /// Answers the call. Only the first answer counts; later ones, and answers to a connection that is
    /// gone, do nothing. `results` fit the member's `outTypes`.
    virtual void reply(Arguments results) = 0;
    virtual void fail(IpcError error) = 0;
};

/// What a connection exports.
class ExportedObject {
public:
    virtual ~ExportedObject() = default;
    /// Handles one call, on the connection's serial queue, with the connection as the current one. The
    /// next message of the connection is handled when the task has ended. A member outside the exported
    /// interfaces, or with other argument types, never gets here. An exception fails the call and is logged.
    virtual Task<void> handle(std::shared_ptr<IncomingCall> call) = 0;
};

using ErrorHandler = std::function<void(const IpcError&)>;
using ReplyHandler = std::function<Task<void>(Arguments)>;

/// The outcome of an awaited call: the results, or why there are none.
struct CallResult {
    std::optional<Arguments> results;
    IpcError error;
};

/// One end of a connection. Configure it, then `resume` it. Any thread. A connection lives while somebody
/// holds it, while it is resumed and its peer is there, and while calls on it are pending.
class Connection {
public:
    virtual ~Connection() = default;

    /// The peer's identity; all zero once it is known to be gone before it could be identified.
    virtual AuditToken auditToken() const = 0;
    /// The peer's process identifier, from the token.
    virtual std::int32_t processIdentifier() const = 0;

    /// What the peer may call, and the object that serves it. The object is held until invalidation.
    virtual void setExportedInterfaces(InterfaceDescriptions interfaces) = 0;
    virtual void setExportedObject(std::shared_ptr<ExportedObject> object) = 0;
    virtual std::shared_ptr<ExportedObject> exportedObject() const = 0;
    /// What may be called on the peer.
    virtual void setRemoteObjectInterfaces(InterfaceDescriptions interfaces) = 0;

    /// Called once, on the connection's queue, when the connection can no longer be used: invalidated here,
    /// or the peer closed it or is gone. Dropped afterwards, with everything it holds.
    virtual void setInvalidationHandler(std::function<void()> handler) = 0;
    /// Called on the connection's queue when the service behind a connection made with
    /// `connectionToService` went away; the next call connects anew. Accepted connections and
    /// connections to endpoints are invalidated instead.
    virtual void setInterruptionHandler(std::function<void()> handler) = 0;

    /// Starts delivering messages.
    virtual void resume() = 0;
    /// Ends the connection. Pending calls fail with `disconnected`.
    virtual void invalidate() = 0;

    /// Calls a member of the peer. None of these block. `send` expects no answer; `call` runs `onReply` as
    /// an item of the connection's queue with this as the current connection; `callAndWait` suspends the
    /// running item. A call fails when the connection ends, and an awaited one also after `timeout`
    /// nanoseconds if that is above zero. Exactly one of the handlers runs, at most once.
    virtual void send(std::string_view interface, std::string_view member, Arguments arguments,
                      ErrorHandler onError) = 0;
    virtual void call(std::string_view interface, std::string_view member, Arguments arguments,
                      ReplyHandler onReply, ErrorHandler onError) = 0;
    virtual Task<CallResult> callAndWait(std::string interface, std::string member, Arguments arguments,
                                         std::int64_t timeout) = 0;
};

class Listener;

/// Decides about new connections.
class ListenerDelegate {
public:
    virtual ~ListenerDelegate() = default;
    /// `listener:shouldAcceptNewConnection:`. Configures and resumes the connection and returns true, or
    /// returns false to refuse it. Runs on a thread of the transport, one at a time for each listener.
    virtual bool listener(Listener& listener, std::shared_ptr<Connection> shouldAcceptNewConnection) = 0;
};

/// Accepts connections, on a service name or anonymously. Kept alive by the transport once resumed, until
/// invalidated. Any thread.
class Listener {
public:
    virtual ~Listener() = default;
    virtual void setDelegate(std::weak_ptr<ListenerDelegate> delegate) = 0;
    virtual void resume() = 0;
    /// Stops accepting. Connections that were accepted go on.
    virtual void invalidate() = 0;
    /// A handle to pass in a message; null for a named listener.
    virtual std::shared_ptr<ListenerEndpoint> endpoint() const = 0;
};

/// The IPC transport. Any thread.
class Ipc {
public:
    virtual ~Ipc() = default;
    /// A listener on a service name. One that cannot be created is logged and accepts nothing.
    virtual std::shared_ptr<Listener> listenerForService(std::string name) = 0;
    virtual std::shared_ptr<Listener> anonymousListener() = 0;
    /// A connection to the listener behind an endpoint received in a message. It is made on `resume`; one
    /// that fails is invalidated.
    virtual std::shared_ptr<Connection> connectionToEndpoint(std::shared_ptr<ListenerEndpoint> endpoint) = 0;
    virtual std::shared_ptr<Connection> connectionToService(std::string name) = 0;
};

/// The connection whose message or reply the running work handles, or null.
inline std::shared_ptr<Connection> currentConnection()
{
    const WorkItem* item = WorkItem::current();
    return item == nullptr ? nullptr : std::static_pointer_cast<Connection>(item->connection);
}

/// The audit token of the current connection; all zero when there is none.
inline AuditToken currentAuditToken()
{
    const auto connection = currentConnection();
    return connection ? connection->auditToken() : AuditToken{};
}

}  // namespace typhon
