#pragma once

#include "platform/ipc.h"
#include "platform/task.h"
#include "protocol/replies.h"

#include <memory>
#include <string>
#include <vector>

namespace typhon {

/// What every client may ask of the daemon. Each operation runs on the calling connection's queue, with
/// that connection as the current one, and its task ends when the connection may go on with its next
/// message. The object outlives the tasks it hands out.
class TyphonProtocol {
public:
    virtual ~TyphonProtocol() = default;

    /// `checkin:`. The fonts and extensions that the caller is entitled to, or null.
    virtual Task<void> checkin(OptionalDictionaryReply reply) = 0;
    /// `checkinForFontPicker:`. All enabled fonts for the font picker; null for everybody else.
    virtual Task<void> checkinForFontPicker(OptionalDictionaryReply reply) = 0;
    /// `requestFonts:reply:`. Asks for the fonts that the request dictionaries name; the reply holds those
    /// that the caller may use, by path.
    virtual Task<void> requestFonts(PropertyList::Array requests, DictionaryReply reply) = 0;
    /// `requestFonts:forClient:reply:`. Hands the fonts of a PostScript name to the client that listens at
    /// an endpoint. For the font picker only.
    virtual Task<void> requestFonts(std::string postScriptName, std::shared_ptr<ListenerEndpoint> forClient,
                                    BooleanReply reply) = 0;
    /// `fontChanged:reply:`. Reports that fonts came or went.
    virtual Task<void> fontChanged(PropertyList change, EmptyReply reply) = 0;
    /// `updatingUserFonts:`. Answered when the daemon is not in the middle of reading the registry.
    virtual Task<void> updatingUserFonts(EmptyReply reply) = 0;
    /// `scheduleFontFilesDeletion:`. Puts font files on the deletion schedule.
    virtual Task<void> scheduleFontFilesDeletion(std::vector<std::string> paths) = 0;
    /// `synchronizeFontAssets:reply:`. The registry entries of the assets that the given files belong to.
    virtual Task<void> synchronizeFontAssets(std::vector<std::string> paths, OutcomeReply reply) = 0;
    /// `resetIssuedFontsFor:reply:`. Forgets what was issued to an application, for entitled callers; the
    /// answer is the same for the others.
    virtual Task<void> resetIssuedFontsFor(std::string identifier, EmptyReply reply) = 0;
};

}  // namespace typhon
