#pragma once

#include "clients/typhon_handler.h"
#include "platform/ipc.h"
#include "platform/task.h"
#include "protocol/wire.h"

#include <memory>
#include <span>

namespace typhon {

/// Who may use an operation. Others get `AccessDenied`, before anything else is looked at.
enum class Admission { everyone, fontPicker };

/// One row of the dispatch table.
struct DispatchedOperation {
    wire::Operation operation;
    Admission admission;
    /// Decodes the arguments, calls the operation and encodes its reply. `object` outlives the task.
    Task<void> (*handler)(TyphonDaemonProtocol& object, std::shared_ptr<IncomingCall> call);
};

/// Every operation that clients can call.
std::span<const DispatchedOperation> dispatchTable();

/// Handles a client's call as the table says, on the queue of the client's connection.
Task<void> dispatch(std::shared_ptr<TyphonHandler> handler, std::shared_ptr<IncomingCall> call);

/// A handler as its client's connection exports it: calls reach it by way of the dispatch table.
class ExportedHandler final : public TyphonHandler, public ExportedObject {
public:
    using TyphonHandler::TyphonHandler;

    Task<void> handle(std::shared_ptr<IncomingCall> call) override
    {
        return dispatch(shared_from_this(), std::move(call));
    }
};

}  // namespace typhon
