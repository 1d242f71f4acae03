#pragma once

#include "fontmanager/font_store.h"
#include "platform/ipc.h"
#include "platform/log.h"
#include "platform/task.h"

#include <cstdint>
#include <memory>

namespace typhon {

/// Tells others about changes of fonts. Any thread; awaited on a work queue.
class ChangeReports {
public:
    enum class Kind : std::uint8_t { userFonts = 0, profileFonts = 1 };

    virtual ~ChangeReports() = default;
    /// A change is about to be written. Returns when nobody reads the registry.
    virtual Task<void> announce() = 0;
    /// A change was written.
    virtual Task<void> report(RegistryChange change, Kind kind) = 0;
};

/// Reports to the font daemon, like any other client. A daemon that is not there, or does not answer, is no
/// failure: it reads the registry when it starts.
class DaemonReports final : public ChangeReports {
public:
    /// Both outlive this.
    DaemonReports(Ipc& ipc, Log& log);
    ~DaemonReports() override;

    Task<void> announce() override;
    Task<void> report(RegistryChange change, Kind kind) override;

private:
    Task<void> send(std::string member, Arguments arguments);

    Log& log_;
    const std::shared_ptr<Connection> daemon_;
};

}  // namespace typhon
