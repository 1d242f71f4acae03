#pragma once

namespace typhon {

/// True when this process runs as the user "typhon", as whom nothing but the system's own services ever runs.
/// Then a process of the same user is one of them, also where the service manager confines it like a sandbox.
bool runsAsServiceUser();

}  // namespace typhon
