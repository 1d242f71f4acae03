#pragma once

#include "platform/audit_token.h"
#include "platform/linux/confinement.h"

#include <cstdint>
#include <optional>

namespace typhon {

/// The device number of the terminal behind a descriptor that somebody passed, or null when it is none, or
/// was not opened for reading and writing. Nothing is kept.
std::optional<std::uint32_t> terminalOfDescriptor(int descriptor);

/// The terminal (device number) in whose foreground the process stands, in a session of its own user or of
/// root that began outside of any sandbox; null when there is none. A process in a sandbox stands where its
/// launcher does, the process outside that the sandbox's first one was started by.
std::optional<std::uint32_t> foregroundTerminalOf(const AuditToken& process, const ConfinementProbe& probe);

}  // namespace typhon
