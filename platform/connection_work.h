#pragma once

#include "platform/ipc.h"
#include "platform/log.h"
#include "platform/task.h"

#include <exception>
#include <memory>
#include <string>
#include <utility>

namespace typhon::connection_work {

// The items of a connection's queue, the same for every transport. What a handler throws ends with the item:
// it is logged, and never reaches the queue.

/// What the running exception says.
inline std::string currentExceptionText()
{
    try {
        throw;
    } catch (const std::exception& exception) {
        return exception.what();
    } catch (...) {
        return "unknown exception";
    }
}

/// Handles one call. Without an object to serve it, the call fails.
inline Task<void> handleCall(Log& log, std::shared_ptr<ExportedObject> object,
                             std::shared_ptr<IncomingCall> call)
{
    if (!object) {
        call->fail({ipc_errors::unknownMethod, "nothing is exported here"});
        co_return;
    }
    try {
        Task<void> handling = object->handle(call);
        co_await std::move(handling);
        co_return;
    } catch (...) {
        TYLog_Error(log, "handler of " + call->member() + " failed: " + currentExceptionText());
    }
    call->fail({ipc_errors::failed, "the call could not be handled"});
}

/// Runs a reply handler.
inline Task<void> handleReply(Log& log, ReplyHandler handler, Arguments results)
{
    try {
        Task<void> handling = handler(std::move(results));
        co_await std::move(handling);
    } catch (...) {
        TYLog_Error(log, "reply handler failed: " + currentExceptionText());
    }
}

/// Runs a plain callback: an error, invalidation or interruption handler bound to its arguments.
inline Task<void> runCallback(Log& log, std::function<void()> callback)
{
    try {
        callback();
    } catch (...) {
        TYLog_Error(log, "connection handler failed: " + currentExceptionText());
    }
    co_return;
}

}  // namespace typhon::connection_work
