#pragma once

#include "platform/ipc.h"

#include <string_view>

namespace typhon {

/// True when the arguments could travel under that D-Bus signature: as many, and each of the right kind and
/// range.
bool argumentsFit(std::string_view types, const Arguments& arguments);

}  // namespace typhon
