#pragma once

#include "fontmanager/daemon/caller_identity.h"
#include "fontmanager/daemon/change_reports.h"
#include "fontmanager/font_assets.h"
#include "fontmanager/font_store.h"
#include "fontmanager/profile_fonts.h"
#include "platform/ipc.h"
#include "platform/log.h"
#include "platform/work_queue.h"

#include <atomic>
#include <cstddef>
#include <memory>
#include <string>
#include <vector>

namespace typhon {

/// The service "com.vorlan.Typhon.UserFontManager": changes fonts for callers that may. Any thread.
class FontRegistryService : public ListenerDelegate,
                            public std::enable_shared_from_this<FontRegistryService> {
public:
    struct Parts {
        FontStore& store;
        ProfileFonts& profileFonts;
        FontAssets& fontAssets;
        CallerIdentities& identities;
        ChangeReports& reports;
        Log& log;
        /// On which changes are made and reported, one after another.
        WorkQueue& changes;
    };

    /// All parts outlive this and every connection.
    FontRegistryService(Parts parts, OwnUser own) : parts_(parts), own_(own) {}

    bool listener(Listener& listener, std::shared_ptr<Connection> shouldAcceptNewConnection) override;

    /// What the service exports.
    static InterfaceDescriptions interfaces();

    const Parts& parts() const { return parts_; }
    const OwnUser& own() const { return own_; }

    /// Connections that are open.
    std::size_t connectionCount() const { return connections_; }
    void connectionBegan() { ++connections_; }
    void connectionEnded() { --connections_; }

private:
    const Parts parts_;
    const OwnUser own_;
    std::atomic<std::size_t> connections_ = 0;
};

/// Opens the service: a resumed listener that asks `service`, which stays alive as long as somebody holds it.
std::shared_ptr<Listener> startFontRegistryService(Ipc& ipc,
                                                   const std::shared_ptr<FontRegistryService>& service);

}  // namespace typhon
