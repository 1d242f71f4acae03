#include "fontmanager/daemon/font_registry_service.h"

#include "fontmanager/daemon/font_registry_session.h"
#include "fontmanager/font_registry_wire.h"

#include <array>

namespace typhon {

namespace {

/// Passes the calls of one connection to its session. The session is kept by the calls it handles.
class FontRegistryObject : public ExportedObject {
public:
    explicit FontRegistryObject(const std::shared_ptr<FontRegistryService>& service)
        : session_(std::make_shared<FontRegistrySession>(service))
    {}

    Task<void> handle(std::shared_ptr<IncomingCall> call) override
    {
        return FontRegistrySession::handle(session_, currentAuditToken(), std::move(call));
    }

private:
    const std::shared_ptr<FontRegistrySession> session_;
};

}  // namespace

bool FontRegistryService::listener(Listener&, std::shared_ptr<Connection> shouldAcceptNewConnection)
{
    shouldAcceptNewConnection->setExportedInterfaces(interfaces());
    shouldAcceptNewConnection->setExportedObject(std::make_shared<FontRegistryObject>(shared_from_this()));
    shouldAcceptNewConnection->resume();
    return true;
}

InterfaceDescriptions FontRegistryService::interfaces()
{
    using namespace font_registry_wire;
    static const auto descriptions = [] {
        InterfaceDescription description{font_registry_wire::interface, {}};
        for (const auto& operation :
             {beginRegistration, addFontFile, commitRegistration, cancelRegistration, unregister,
              unregisterAll, enableOrDisable, font_registry_wire::synchronizeFontProviders,
              font_registry_wire::synchronizeProfileFonts, font_registry_wire::synchronizeFontAssets}) {
            description.members.push_back({operation.member, operation.inTypes, operation.outTypes, true});
        }
        return std::make_shared<const std::vector<InterfaceDescription>>(
            std::vector<InterfaceDescription>{std::move(description)});
    }();
    return descriptions;
}

std::shared_ptr<Listener> startFontRegistryService(Ipc& ipc,
                                                   const std::shared_ptr<FontRegistryService>& service)
{
    auto listener = ipc.listenerForService(font_registry_wire::serviceName);
    listener->setDelegate(service);
    listener->resume();
    return listener;
}

}  // namespace typhon
