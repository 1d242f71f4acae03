#include "daemon/operations.h"

#include <algorithm>
#include <array>
#include <string_view>
#include <utility>

// The one table of what clients can call, who may, and how a call becomes an operation and its reply block a
// message. The transport has checked a call's argument types against the table's before it gets here. A reply
// block that is dropped uncalled leaves its caller without an answer, which is what some operations intend.

namespace typhon {

namespace {

using Call = std::shared_ptr<IncomingCall>;

const PropertyList& value(const Call& call, std::size_t index)
{
    return std::get<PropertyList>(call->arguments().at(index));
}

std::string text(const Call& call, std::size_t index)
{
    return *value(call, index).asString();
}

PropertyList::Array values(const Call& call, std::size_t index)
{
    return *value(call, index).asArray();
}

std::vector<std::string> texts(const Call& call, std::size_t index)
{
    return stringsOf(value(call, index));
}

std::shared_ptr<ListenerEndpoint> endpoint(const Call& call, std::size_t index)
{
    return std::get<std::shared_ptr<TransferredFile>>(call->arguments().at(index));
}

void answer(const Call& call, PropertyList result)
{
    Arguments results;
    results.emplace_back(std::move(result));
    call->reply(std::move(results));
}

EmptyReply emptyReply(const Call& call)
{
    return [call] { call->reply({}); };
}

OptionalDictionaryReply optionalDictionaryReply(const Call& call)
{
    return [call](std::optional<PropertyList> result) { answer(call, wire::nullable(std::move(result))); };
}

DictionaryReply dictionaryReply(const Call& call)
{
    return [call](PropertyList result) { answer(call, std::move(result)); };
}

BooleanReply booleanReply(const Call& call)
{
    return [call](bool result) { answer(call, result); };
}

OutcomeReply outcomeReply(const Call& call)
{
    return [call](bool success, std::optional<PropertyList> result) {
        Arguments results;
        results.emplace_back(PropertyList(success));
        results.emplace_back(wire::nullable(std::move(result)));
        call->reply(std::move(results));
    };
}

Task<void> checkin(TyphonDaemonProtocol& object, Call call)
{
    return object.checkin(optionalDictionaryReply(call));
}

Task<void> checkinForFontPicker(TyphonDaemonProtocol& object, Call call)
{
    return object.checkinForFontPicker(optionalDictionaryReply(call));
}

Task<void> requestFonts(TyphonDaemonProtocol& object, Call call)
{
    return object.requestFonts(values(call, 0), dictionaryReply(call));
}

Task<void> requestFontsForClient(TyphonDaemonProtocol& object, Call call)
{
    return object.requestFonts(text(call, 0), endpoint(call, 1), booleanReply(call));
}

Task<void> fontChanged(TyphonDaemonProtocol& object, Call call)
{
    return object.fontChanged(value(call, 0), emptyReply(call));
}

Task<void> updatingUserFonts(TyphonDaemonProtocol& object, Call call)
{
    return object.updatingUserFonts(emptyReply(call));
}

/// Has no reply block; a caller that expects a reply gets an empty one when the operation has ended.
Task<void> scheduleFontFilesDeletion(TyphonDaemonProtocol& object, Call call)
{
    auto scheduling = object.scheduleFontFilesDeletion(texts(call, 0));
    co_await std::move(scheduling);
    call->reply({});
}

Task<void> synchronizeFontAssets(TyphonDaemonProtocol& object, Call call)
{
    return object.synchronizeFontAssets(texts(call, 0), outcomeReply(call));
}

Task<void> resetIssuedFontsFor(TyphonDaemonProtocol& object, Call call)
{
    return object.resetIssuedFontsFor(text(call, 0), emptyReply(call));
}

Task<void> checkinForSilkpageProcess(TyphonDaemonProtocol& object, Call call)
{
    return object.checkinForSilkpageProcess(endpoint(call, 0), emptyReply(call));
}

Task<void> sendFonts(TyphonDaemonProtocol& object, Call call)
{
    return object.sendFonts(values(call, 0), emptyReply(call));
}

using enum Admission;

constexpr std::array table{
    DispatchedOperation{wire::checkin, everyone, checkin},
    DispatchedOperation{wire::checkinForFontPicker, everyone, checkinForFontPicker},
    DispatchedOperation{wire::requestFonts, everyone, requestFonts},
    DispatchedOperation{wire::requestFontsForClient, fontPicker, requestFontsForClient},
    DispatchedOperation{wire::fontChanged, everyone, fontChanged},
    DispatchedOperation{wire::updatingUserFonts, everyone, updatingUserFonts},
    DispatchedOperation{wire::scheduleFontFilesDeletion, everyone, scheduleFontFilesDeletion},
    DispatchedOperation{wire::synchronizeFontAssets, everyone, synchronizeFontAssets},
    DispatchedOperation{wire::resetIssuedFontsFor, everyone, resetIssuedFontsFor},
    DispatchedOperation{wire::checkinForSilkpageProcess, everyone, checkinForSilkpageProcess},
    DispatchedOperation{wire::sendFonts, everyone, sendFonts},
};

const DispatchedOperation* find(std::string_view interface, std::string_view member)
{
    const auto found = std::ranges::find_if(table, [&](const DispatchedOperation& row) {
        return row.operation.member == member && row.operation.interface == interface;
    });
    return found == table.end() ? nullptr : &*found;
}

}  // namespace

std::span<const DispatchedOperation> dispatchTable()
{
    return table;
}

Task<void> dispatch(std::shared_ptr<TyphonHandler> handler, std::shared_ptr<IncomingCall> call)
{
    const auto* row = find(call->interface(), call->member());
    if (row == nullptr) {
        call->fail({ipc_errors::unknownMethod, "there is no " + call->interface() + "." + call->member()});
        co_return;
    }
    if (row->admission == fontPicker && !handler->server()->isCurrentConnectionFontPicker()) {
        call->fail({ipc_errors::accessDenied, call->member() + " is for the font picker only"});
        co_return;
    }
    auto handling = row->handler(*handler, call);
    co_await std::move(handling);
}

}  // namespace typhon
