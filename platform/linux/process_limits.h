#pragma once

namespace typhon {

/// Prepares the process for many connections: raises the limit on open descriptors as far as the system
/// allows, and lets writes to a peer that is gone fail instead of ending the process. Before any thread is
/// started.
void prepareProcess();

}  // namespace typhon
