#pragma once

namespace typhon {

/// Prepares the process for many connections: raises the limit on open descriptors as far as the system
/// allows, lets writes to a peer that is gone fail instead of ending the process, and has large blocks of
/// memory returned to the system. Before any thread is started.
void prepareProcess();

}  // namespace typhon
