#include "fontmanager/daemon/change_reports.h"

#include "platform/file_url.h"
#include "protocol/wire.h"

#include <chrono>
#include <utility>

namespace typhon {

namespace {

constexpr std::int64_t patience = std::chrono::nanoseconds(std::chrono::seconds(10)).count();

PropertyList description(const std::vector<std::string>& paths, bool added, ChangeReports::Kind kind)
{
    std::vector<std::string> urls;
    urls.reserve(paths.size());
    for (const auto& path : paths) {
        urls.push_back(fileUrlFromPath(path));
    }
    return PropertyList::Dictionary{
        {"urls", arrayOfStrings(urls)}, {"added", added}, {"kind", static_cast<std::int64_t>(kind)}};
}

}  // namespace

DaemonReports::DaemonReports(Ipc& ipc, Log& log)
    : log_(log), daemon_(ipc.connectionToService(wire::serviceName))
{
    daemon_->setRemoteObjectInterfaces(wire::typhonDaemonInterfaces());
    daemon_->resume();
}

DaemonReports::~DaemonReports()
{
    daemon_->invalidate();
}

Task<void> DaemonReports::announce()
{
    return send(wire::updatingUserFonts.member, {});
}

Task<void> DaemonReports::report(RegistryChange change, Kind kind)
{
    if (!change.gone.empty()) {
        Arguments arguments;
        arguments.emplace_back(description(change.gone, false, kind));
        Task<void> sending = send(wire::fontChanged.member, std::move(arguments));
        co_await std::move(sending);
    }
    // A change that nobody can see is reported without a font, so that the daemon reads the registry anew.
    if (!change.available.empty() || (change.gone.empty() && change.isRegistryChanged)) {
        Arguments arguments;
        arguments.emplace_back(description(change.available, true, kind));
        Task<void> sending = send(wire::fontChanged.member, std::move(arguments));
        co_await std::move(sending);
    }
    if (!change.gone.empty() || !change.available.empty() || change.isRegistryChanged) {
        // A report is answered before anything is done about it, and what comes next is taken afterwards: so
        // whoever made the change sees it as soon as the change is answered.
        Task<void> settling = send(wire::updatingUserFonts.member, {});
        co_await std::move(settling);
    }
}

Task<void> DaemonReports::send(std::string member, Arguments arguments)
{
    Task<CallResult> calling =
        daemon_->callAndWait(wire::typhonProtocol, member, std::move(arguments), patience);
    const CallResult result = co_await std::move(calling);
    if (!result.results) {
        TYLog_Debug(log_, "the font daemon was not told (" + member + "): " + result.error.message);
    }
}

}  // namespace typhon
