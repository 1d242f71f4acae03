#pragma once

#include "protocol/typhon_protocol.h"
#include "protocol/typhon_silkpage_support_protocol.h"

namespace typhon {

/// Everything that a connection to the daemon exports.
class TyphonDaemonProtocol : public TyphonProtocol, public TyphonSilkpageSupportProtocol {};

}  // namespace typhon
